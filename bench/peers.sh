#!/usr/bin/env bash
# tav-ipmi side by side with ipmitool and FreeIPMI: every program runs against
# the simulated controller through its preload library, each answer taking a
# real latency, and the simulator counts the exchanges. Prints one markdown
# table on stdout (progress and notes on stderr); bench/README.md explains
# the rows.
#
#   bench/peers.sh [--quick] [--latency MS,...] [--profiles NAME,...] [--build DIR]
#
# --latency     milliseconds per exchange (default 1,5)
# --profiles    default, real (the largest ipmi_sim profile of a real server
#               in ../shared/data/real/sim), generated:N, or a profile file
#               (default default,real,generated:1000)
# --quick       1 ms, the default profile only
# --build DIR   the build tree with the tool, the preload library and
#               tav-ipmi-ops (default build)
#
# Fails when a command fails, prints nothing, or the simulator answered none
# of its requests.
set -euo pipefail

root=$(cd "$(dirname "$0")/.." && pwd)
build=$root/build
latencies=1,5
profiles=default,real,generated:1000

usage() {
  sed -n '8,16p' "$0" | sed 's/^# \{0,1\}//' >&2
  exit 2
}
while [ $# -gt 0 ]; do
  case $1 in
  --quick) latencies=1 profiles=default ;;
  --latency) [ $# -ge 2 ] || usage; latencies=$2; shift ;;
  --profiles) [ $# -ge 2 ] || usage; profiles=$2; shift ;;
  --build) [ $# -ge 2 ] || usage; build=$2; shift ;;
  *) usage ;;
  esac
  shift
done

fail() {
  echo "peers.sh: $*" >&2
  exit 1
}

build=$(cd "$build" 2>/dev/null && pwd) || fail "no build tree at $build"
tool=$build/tools/tavipmi
preload=$build/sim/libtav-ipmi-sim-preload.so
ops=$build/bench/ops/tav-ipmi-ops
for f in "$tool" "$preload" "$ops"; do
  [ -e "$f" ] || fail "$f missing: build with -DTAV_IPMI_BUILD_BENCH=ON -DTAV_IPMI_BUILD_TOOL=ON"
done
export PATH=$PATH:/usr/sbin:/sbin  # FreeIPMI installs there
for p in ipmitool ipmi-sensors ipmi-sel ipmi-fru; do
  command -v "$p" >/dev/null || fail "$p not installed (scripts/install-deps.sh installs it)"
done

work=$(mktemp -d /tmp/tav-peers-XXXXXX)
trap 'rm -rf "$work"' EXIT

# The simulator's environment, and nothing of the caller's that steers it.
simulated() {
  env -u TAV_IPMI_SIM_VIRTUAL_TIME -u TAV_IPMI_SIM_CONTROL -u TAV_IPMI_SIM_COUNTS -u TAV_IPMI_SIM_LATENCY_US \
    LD_PRELOAD="$preload" TAV_IPMI_SIM_PROFILE="$profile" "$@"
}

# The real server profile with the most SDR records, as the simulator loads it.
largest_real_profile() {
  local dir=$root/../shared/data/real/sim best="" most=0 f n
  if [ ! -d "$dir" ]; then
    echo "peers.sh: no real profiles in $dir: the real profile is skipped" >&2
    return
  fi
  for f in "$dir"/*.emu; do
    [ -e "$f" ] || continue
    n=$(profile=$f simulated TAV_IPMI_SIM_VIRTUAL_TIME=1 ipmitool -I open sdr info 2>/dev/null |
      awk -F: '/^Record Count/ {print $2 + 0}') || true
    if [ -n "$n" ] && [ "$n" -gt "$most" ]; then
      most=$n
      best=$(cd "$(dirname "$f")" && pwd)/$(basename "$f")
    fi
  done
  [ -n "$best" ] || echo "peers.sh: no real profile in $dir loads: the real profile is skipped" >&2
  echo "$best"
}

# run EMPTY_OK COMMAND...: runs the command on the simulator at the current
# profile and latency. Sets wall_ms and exchanges; stdout is kept in $work/out.
run() {
  local empty_ok=$1 rc=0 t0 t1
  shift
  rm -f "$work/counts"
  t0=$(date +%s%N)
  simulated TAV_IPMI_SIM_LATENCY_US="$latency_us" TAV_IPMI_SIM_COUNTS="$work/counts" "$@" \
    >"$work/out" 2>"$work/err" || rc=$?
  t1=$(date +%s%N)
  wall_ms=$(awk -v ns=$((t1 - t0)) 'BEGIN {printf "%.1f", ns / 1e6}')
  [ "$rc" -eq 0 ] || fail "$profile_name: $*: exit status $rc: $(head -c 400 "$work/err")"
  exchanges=$(awk '$1 == "total" {print $2}' "$work/counts" 2>/dev/null || true)
  [ -n "$exchanges" ] && [ "$exchanges" -gt 0 ] || fail "$profile_name: $*: the simulator answered nothing"
  [ -s "$work/out" ] || [ "$empty_ok" = 1 ] || fail "$profile_name: $*: printed nothing"
}

ratio() { awk -v p="$1" -v o="$2" 'BEGIN {if (o > 0) printf "%.2f", p / o; else print "-"}'; }

rows=""
row() {  # operation ours our_exchanges our_wall peer peer_exchanges peer_wall
  local r="-"
  [ "$5" = "-" ] || r=$(ratio "$7" "$4")
  rows+="| $profile_name | $latency ms | $1 | $2 | $3 | $4 | $5 | $6 | $7 | $r |"$'\n'
}

# Our figures and the peers' of one profile and latency, by key.
declare -A ex ms pex pms

peer() {  # KEY EMPTY_OK COMMAND...
  local key=$1
  shift
  run "$@"
  pex[$key]=$exchanges
  pms[$key]=$wall_ms
}

line() {  # OPERATION OUR_KEY PEER_KEY PEER_LABEL
  local ours="\`${2/tavipmi-/tavipmi }\`"
  case $2 in *-warm) ours="\`tavipmi ${2#tavipmi-}"; ours="${ours%-warm}\` (warm SDR cache)" ;; esac
  row "$1" "$ours" "${ex[$2]}" "${ms[$2]}" "$4" "${pex[$3]}" "${pms[$3]}"
}

wanted=()
IFS=, read -r -a asked <<<"$profiles"
for p in "${asked[@]}"; do
  if [ "$p" = real ]; then
    p=$(largest_real_profile)
    [ -n "$p" ] || continue
  fi
  wanted+=("$p")
done
[ ${#wanted[@]} -gt 0 ] || fail "no profile to run"
IFS=, read -r -a lat_list <<<"$latencies"
for latency in "${lat_list[@]}"; do
  [[ $latency =~ ^[0-9]+(\.[0-9]+)?$ ]] || fail "--latency $latency: milliseconds expected"
done

for profile in "${wanted[@]}"; do
  profile_name=$(basename "$profile" .emu)
  for latency in "${lat_list[@]}"; do
    latency_us=$(awk -v ms="$latency" 'BEGIN {printf "%d", ms * 1000 + 0.5}')
    echo "peers.sh: $profile_name at $latency ms per exchange" >&2
    ex=() ms=() pex=() pms=()

    # Our side: the operations in one client process.
    run 0 "$ops"
    while read -r op n t; do
      ex[$op]=$n
      ms[$op]=$t
    done <"$work/out"
    for op in cold refresh cached sel fru; do
      [ -n "${ex[$op]:-}" ] || fail "$profile_name: tav-ipmi-ops did not report $op"
      [ "$op" = cached ] || [ "${ex[$op]}" -gt 0 ] || fail "$profile_name: $op: the simulator answered nothing"
    done
    # The tool's views from an empty SDR cache of their own, then again on
    # the cache that run left (the peers' warm rows have theirs filled).
    for view in sensors sel fru; do
      rm -rf "$work/tav-sdr-cache"
      run 0 "$tool" --sdr-cache "$work/tav-sdr-cache" "$view"
      ex[tavipmi-$view]=$exchanges
      ms[tavipmi-$view]=$wall_ms
      run 0 "$tool" --sdr-cache "$work/tav-sdr-cache" "$view"
      ex[tavipmi-$view-warm]=$exchanges
      ms[tavipmi-$view-warm]=$wall_ms
    done

    # Theirs. FreeIPMI keeps its SDR cache in a directory: empty for the cold
    # run, then warm for the readings, the SEL and the FRU. ipmi-sensors reads
    # the sensors of the controllers behind the BMC only when asked to, as
    # ipmitool and the library always do.
    cache=$work/sdr-cache
    rm -rf "$cache"
    mkdir "$cache"
    freeipmi=(--driver-type=OPENIPMI --sdr-cache-directory="$cache" --quiet-cache)
    peer elist 0 ipmitool -I open sdr elist
    peer sensor 0 ipmitool -I open sensor
    peer sensors-cold 0 ipmi-sensors "${freeipmi[@]}" --bridge-sensors
    peer sensors-warm 0 ipmi-sensors "${freeipmi[@]}" --bridge-sensors
    # An empty log is no failure: ipmitool says so, ipmi-sel prints nothing.
    peer sel-elist 1 ipmitool -I open sel elist
    sel_label=SEL
    if [ ! -s "$work/out" ]; then
      grep -q "SEL has no entries" "$work/err" || fail "$profile_name: ipmitool sel elist printed nothing"
      sel_label="SEL (empty)"
    fi
    peer ipmi-sel 1 ipmi-sel "${freeipmi[@]}"
    [ -s "$work/out" ] || [ "$sel_label" != SEL ] || fail "$profile_name: ipmi-sel printed nothing"
    peer fru-print 0 ipmitool -I open fru print
    peer ipmi-fru 0 ipmi-fru "${freeipmi[@]}"

    line "sensors, cold" cold elist "\`ipmitool sdr elist\`"
    line "sensors, cold" cold sensor "\`ipmitool sensor\`"
    line "sensors, cold" cold sensors-cold "\`ipmi-sensors\` (empty SDR cache)"
    line "readings, warm" refresh sensors-warm "\`ipmi-sensors\` (warm SDR cache)"
    row "readings, warm" "\`cached\`" "${ex[cached]}" "${ms[cached]}" "-" "-" "-"
    line "$sel_label" sel sel-elist "\`ipmitool sel elist\`"
    line "$sel_label" sel ipmi-sel "\`ipmi-sel\` (warm SDR cache)"
    line FRU fru fru-print "\`ipmitool fru print\`"
    line FRU fru ipmi-fru "\`ipmi-fru\` (warm SDR cache)"
    line "sensors, process" tavipmi-sensors sensor "\`ipmitool sensor\`"
    line "sensors, process" tavipmi-sensors sensors-cold "\`ipmi-sensors\` (empty SDR cache)"
    line "sensors, process, warm" tavipmi-sensors-warm sensors-warm "\`ipmi-sensors\` (warm SDR cache)"
    line "$sel_label, process" tavipmi-sel sel-elist "\`ipmitool sel elist\`"
    line "$sel_label, process, warm" tavipmi-sel-warm ipmi-sel "\`ipmi-sel\` (warm SDR cache)"
    line "FRU, process" tavipmi-fru fru-print "\`ipmitool fru print\`"
    line "FRU, process, warm" tavipmi-fru-warm ipmi-fru "\`ipmi-fru\` (warm SDR cache)"
  done
done

echo "| profile | latency | operation | ours | our exchanges | our wall ms | peer | peer exchanges | peer wall ms | peer/ours |"
echo "|---|---|---|---|---:|---:|---|---:|---:|---:|"
printf '%s' "$rows"
