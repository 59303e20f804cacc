#!/usr/bin/env bash
# The library, its tool and ipmitool on the real Linux IPMI driver: a QEMU
# guest running Debian's kernel (ipmi_msghandler, ipmi_si over KCS,
# ipmi_devintf) against OpenIPMI's ipmi_sim as the BMC. Runs the checker in
# tests/vm twice on plain BMCs (the project's default profile and one captured
# server) and once with a slow and lossy BMC. Skips, with exit 0, where QEMU or
# the packages it needs cannot be had.
#
# Environment: TAV_IPMI_VM_BUILD (build directory, default build-vm),
# TAV_IPMI_VM_CACHE (kernel cache), TAV_IPMI_VM_PROFILE (captured server),
# TAV_IPMI_VM_PASSES (default: "default captured faults").
set -euo pipefail
cd "$(dirname "$0")/.."

skip() {
  echo "== VM stage skipped: $*"
  exit 0
}

cache=${TAV_IPMI_VM_CACHE:-${XDG_CACHE_HOME:-$HOME/.cache}/tav-ipmi-vm}
build=${TAV_IPMI_VM_BUILD:-build-vm}
realProfile=${TAV_IPMI_VM_PROFILE:-../shared/data/real/sim/infrasim_dell_r630.emu}
sudo=""
[ "$(id -u)" -ne 0 ] && sudo="sudo"
apt() { DEBIAN_FRONTEND=noninteractive $sudo apt-get -o DPkg::Lock::Timeout=300 "$@"; }

need=()
command -v cmake >/dev/null || need+=(cmake)
command -v g++ >/dev/null || need+=(g++)
command -v make >/dev/null || need+=(make)
[ -f /usr/include/linux/ipmi.h ] || need+=(linux-libc-dev)
command -v qemu-system-x86_64 >/dev/null || need+=(qemu-system-x86)
[ -f /usr/share/seabios/bios-256k.bin ] || need+=(seabios)
command -v ipmi_sim >/dev/null || need+=(openipmi)
command -v busybox >/dev/null || need+=(busybox-static)
command -v ipmitool >/dev/null || need+=(ipmitool)
command -v python3 >/dev/null || need+=(python3)
if [ ${#need[@]} -gt 0 ]; then
  { apt update -qq && apt install -y -qq --no-install-recommends "${need[@]}"; } >/dev/null 2>&1 ||
    skip "could not install ${need[*]}"
fi
# QEMU can run when a paused machine comes up and stays up.
qemu-system-x86_64 -M pc -display none -nic none -S -monitor none -serial none >/dev/null 2>&1 &
probe=$!
sleep 1
kill -0 "$probe" 2>/dev/null || skip "QEMU does not run here"
kill "$probe" && wait "$probe" 2>/dev/null || true

# The guest kernel: Debian's current one, unpacked into the cache (never
# installed). Only the boot image and the IPMI modules are kept.
kernelPackage() { apt-cache depends linux-image-amd64 2>/dev/null | sed -n 's/.*Depends: linux-image-//p' | head -n 1; }
kver=$(kernelPackage)
if [ -z "$kver" ]; then
  apt update -qq >/dev/null 2>&1 || true
  kver=$(kernelPackage)
fi
if [ -z "$kver" ]; then
  kver=$(ls -1 "$cache" 2>/dev/null | sort -V | tail -n 1)
  [ -n "$kver" ] || skip "no Debian kernel package found"
fi
kdir=$cache/$kver
if [ ! -f "$kdir/vmlinuz" ]; then
  echo "== fetching the guest kernel $kver"
  unpack=$(mktemp -d)
  trap 'rm -rf "$unpack"' EXIT
  (cd "$unpack" && apt-get download "linux-image-$kver" >/dev/null 2>&1) || skip "cannot download linux-image-$kver"
  dpkg-deb -x "$unpack"/linux-image-*.deb "$unpack/root"
  tree=$unpack/root/lib/modules/$kver
  # Load order as modprobe would give it: every module after what it depends on
  # (the .modinfo section's depends= line).
  order=()
  addModule() {
    local m=$1 ko dep
    for done in "${order[@]}"; do [ "$done" = "$m" ] && return; done
    ko=$(find "$tree" -name "$m.ko" | head -n 1)
    [ -n "$ko" ] || skip "module $m missing from linux-image-$kver"
    for dep in $(tr '\0' '\n' <"$ko" | sed -n 's/^depends=//p' | tr ',' ' '); do addModule "$dep"; done
    mkdir -p "$kdir.new/modules"
    cp "$ko" "$kdir.new/modules/"
    order+=("$m")
  }
  rm -rf "$kdir.new"
  addModule ipmi_si
  addModule ipmi_devintf
  printf '%s\n' "${order[@]}" >"$kdir.new/modules/load-order"
  cp "$unpack/root/boot/vmlinuz-$kver" "$kdir.new/vmlinuz"
  rm -rf "$kdir" && mv "$kdir.new" "$kdir"
  # Kernels the archive no longer offers are not kept.
  for old in "$cache"/*; do [ "$old" = "$kdir" ] || rm -rf "$old"; done
fi

echo "== building the guest checker"
options=(-DTAV_IPMI_BUILD_VM_TESTS=ON -DTAV_IPMI_BUILD_TOOL=ON)
# A build directory of its own needs neither the unit tests nor the benchmarks;
# one shared with scripts/test.sh keeps its settings.
[ -f "$build/CMakeCache.txt" ] ||
  options+=(-DTAV_IPMI_BUILD_TESTS=OFF -DTAV_IPMI_BUILD_BENCH=OFF -DTAV_IPMI_SANITIZE=)
cmake -S . -B "$build" "${options[@]}" >/dev/null
cmake --build "$build" -j2 --target tavipmi tav-vm-check

# The guest's root: busybox, the modules, the programs with every library
# they load (at the same paths, so the build tree's run paths still hold).
root=$build/vm/root
rm -rf "$build/vm" && mkdir -p "$root"/{bin,lib/modules,etc/sfcb/tav,usr/local/bin}
addProgram() {
  local file=$1 target=$2 lib
  mkdir -p "$root$(dirname "$target")"
  cp -L "$file" "$root$target"
  for lib in $(ldd "$file" 2>/dev/null | grep -o '/[^ ]*'); do
    mkdir -p "$root$(dirname "$lib")"
    [ -e "$root$lib" ] || cp -L "$lib" "$root$lib"
  done
}
addProgram "$(command -v busybox)" /bin/busybox
addProgram "$(command -v ipmitool)" /usr/bin/ipmitool
addProgram "$build/tools/tavipmi" /usr/local/bin/tavipmi
addProgram "$build/tests/vm/tav-vm-check" /usr/local/bin/tav-vm-check
cp "$kdir"/modules/* "$root/lib/modules/"
cp data/sensor_health "$root/etc/sfcb/tav/sensor_health"
cp vm/init "$root/init"
(cd "$root" && find . | busybox cpio -o -H newc 2>/dev/null) | gzip -1 >"$build/vm/initrd.gz"

bmcVersion=$(dpkg-query -W -f '${Version}' openipmi 2>/dev/null || true)
echo "== VM stage: guest kernel $kver, BMC OpenIPMI ipmi_sim (${bmcVersion:-version unknown}) over QEMU isa-ipmi-kcs"
failed=0
pass() {
  local name=$1 profile=$2 mode=$3
  echo "== VM pass: $name ($mode, profile $(basename "$profile"))"
  python3 vm/harness.py --kernel "$kdir/vmlinuz" --initrd "$build/vm/initrd.gz" --profile "$profile" \
    --workdir "$build/vm/$name" --mode "$mode" --timeout 240 || failed=$((failed + 1))
}
for name in ${TAV_IPMI_VM_PASSES:-default captured faults}; do
  case $name in
  default) pass default sim/profiles/default.emu normal ;;
  captured)
    if [ -f "$realProfile" ]; then
      pass captured "$realProfile" normal
    else
      echo "== VM pass captured: skipped, $realProfile not found"
    fi
    ;;
  faults) pass faults sim/profiles/default.emu faults ;;
  esac
done
if [ "$failed" -ne 0 ]; then
  echo "== VM stage: $failed pass(es) failed (logs in $build/vm/*/)"
  exit 1
fi
echo "== VM stage passed"
