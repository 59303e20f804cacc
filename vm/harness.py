#!/usr/bin/env python3
"""Boots the test guest against OpenIPMI's ipmi_sim and reports what it prints.

QEMU's ipmi-bmc-extern reaches ipmi_sim through a small proxy in this process.
The proxy forwards the VM serial protocol both ways and can, on request, delay
or drop requests (a slow or lossy controller). The guest asks for that in band:
an OEM request (netfn 0x30, command 0xF0) that the proxy answers itself, so a
fault starts exactly between two of the guest's own requests. The same channel
passes lines to ipmi_sim's console (new SEL records, changed readings).

Exit status: the guest's, 1 when it never reported one (crash, hang, time-out).
"""

import argparse
import os
import re
import socket
import subprocess
import sys
import threading
import time

MSG_END, CMD_END, ESCAPE = 0xA0, 0xA1, 0xAA
CONTROL_NETFN, CONTROL_CMD = 0x30, 0xF0
OP_DROP, OP_DELAY, OP_SEL_ADD, OP_CONSOLE = 1, 2, 3, 4
ANY = 0xFF

# A system event record as ipmi_sim's console takes it: record type, then 13
# bytes (time stamp, generator, revision, sensor type and number, event type,
# event data): a processor IERR asserted on sensor 0x52.
SEL_RECORD = "sel_add 0x20 0x02 0x00 0x00 0x00 0x00 0x20 0x00 0x04 0x07 0x52 0x6f 0x00 0xff 0xff"


def free_port(kind=socket.SOCK_STREAM):
    with socket.socket(socket.AF_INET, kind) as s:
        s.bind(("127.0.0.1", 0))
        return s.getsockname()[1]


def frame(payload):
    """Escapes a message and closes it with the message end byte."""
    out = bytearray()
    for b in payload:
        if b in (MSG_END, CMD_END, ESCAPE):
            out += bytes([ESCAPE, b | 0x10])
        else:
            out.append(b)
    out.append(MSG_END)
    return bytes(out)


def checksum(data):
    return (-sum(data)) & 0xFF


class Bmc:
    """ipmi_sim with its console on a pipe."""

    def __init__(self, workdir, profile, startup_records):
        self.serial_port = free_port()
        lan_port = free_port(socket.SOCK_DGRAM)
        conf = os.path.join(workdir, "lan.conf")
        with open(conf, "w") as f:
            f.write(f"""name "tavvm"
set_working_mc 0x20
  startlan 1
    addr 127.0.0.1 {lan_port}
    priv_limit admin
    allowed_auths_callback none
    allowed_auths_user none
    allowed_auths_operator none
    allowed_auths_admin none
    guid a123456789abcdefa123456789abcdef
  endlan
  serial kcs 127.0.0.1 {self.serial_port} codec VM
  user 2 true "admin" "admin" admin 10 none
""")
        emu = os.path.join(workdir, "bmc.emu")
        with open(profile) as src, open(emu, "w") as dst:
            dst.write(src.read())
            # Records that exist before the guest boots: the library must not
            # hand them to SEL handlers as new events.
            dst.write("\nsel_enable 0x20 1000 0x0b\n")
            for _ in range(startup_records):
                dst.write(SEL_RECORD + "\n")
        state = os.path.join(workdir, "state")
        os.makedirs(state, exist_ok=True)
        self.log = open(os.path.join(workdir, "ipmi_sim.log"), "w")
        self.proc = subprocess.Popen(["ipmi_sim", "-c", conf, "-f", emu, "-s", state, "-p"],
                                     stdin=subprocess.PIPE, stdout=self.log, stderr=subprocess.STDOUT)
        self.lock = threading.Lock()

    def console(self, line):
        with self.lock:
            self.proc.stdin.write((line + "\n").encode())
            self.proc.stdin.flush()

    def connect(self, deadline):
        while time.time() < deadline:
            try:
                return socket.create_connection(("127.0.0.1", self.serial_port))
            except OSError:
                if self.proc.poll() is not None:
                    raise RuntimeError("ipmi_sim ended at start, see ipmi_sim.log")
                time.sleep(0.1)
        raise RuntimeError("ipmi_sim did not listen")

    def close(self):
        if self.proc.poll() is None:
            self.proc.kill()
        self.proc.wait()
        self.log.close()


class Proxy:
    """Between QEMU and ipmi_sim: forwards, delays, drops, answers control requests."""

    def __init__(self, bmc):
        self.bmc = bmc
        self.listener = socket.socket()
        self.listener.bind(("127.0.0.1", 0))
        self.listener.listen(1)
        self.port = self.listener.getsockname()[1]
        self.delay = 0.0
        self.drops = []  # [remaining, netfn, cmd]

    def start(self, deadline):
        threading.Thread(target=self._run, args=(deadline,), daemon=True).start()

    def _run(self, deadline):
        self.guest, _ = self.listener.accept()
        self.sim = self.bmc.connect(deadline)
        self.guest_lock = threading.Lock()
        threading.Thread(target=self._pump_answers, daemon=True).start()
        self._pump_requests()

    def _to_guest(self, data):
        with self.guest_lock:
            self.guest.sendall(data)

    def _pump_answers(self):
        while True:
            data = self.sim.recv(4096)
            if not data:
                return
            self._to_guest(data)

    def _pump_requests(self):
        raw = bytearray()
        while True:
            data = self.guest.recv(4096)
            if not data:
                return
            for b in data:
                raw.append(b)
                if b == CMD_END:
                    self.sim.sendall(bytes(raw))
                    raw.clear()
                elif b == MSG_END:
                    self._request(bytes(raw))
                    raw.clear()

    def _request(self, raw):
        msg, escaped = bytearray(), False
        for b in raw[:-1]:
            if b == ESCAPE:
                escaped = True
                continue
            msg.append(b & ~0x10 if escaped else b)
            escaped = False
        if len(msg) < 4:
            self.sim.sendall(raw)
            return
        seq, netfn, cmd, data = msg[0], msg[1] >> 2, msg[2], msg[3:-1]
        if netfn == CONTROL_NETFN and cmd == CONTROL_CMD:
            self._control(bytes(data))
            answer = bytes([seq, ((netfn | 1) << 2) | (msg[1] & 3), cmd, 0])
            self._to_guest(frame(answer + bytes([checksum(answer)])))
            return
        for rule in self.drops:
            if rule[0] > 0 and rule[1] in (ANY, netfn) and rule[2] in (ANY, cmd):
                rule[0] -= 1
                log(f"proxy: dropped netfn 0x{netfn:02x} cmd 0x{cmd:02x}")
                return
        if self.delay:
            time.sleep(self.delay)
        self.sim.sendall(raw)

    def _control(self, data):
        op = data[0] if data else 0
        if op == OP_DROP and len(data) >= 4:
            self.drops.append([data[1], data[2], data[3]])
            log(f"proxy: dropping the next {data[1]} request(s) netfn 0x{data[2]:02x} cmd 0x{data[3]:02x}")
        elif op == OP_DELAY and len(data) >= 3:
            self.delay = (data[1] | data[2] << 8) / 1000.0
            log(f"proxy: answers delayed by {self.delay:.1f} s")
        elif op in (OP_SEL_ADD, OP_CONSOLE) and len(data) >= 2:
            lines = [SEL_RECORD] * data[1] if op == OP_SEL_ADD else [data[1:].decode(errors="replace")]
            for line in lines:
                self.bmc.console(line)
                log(f"proxy: ipmi_sim console: {line}")
            # The console and the serial link are served by one loop in
            # ipmi_sim; a moment lets the change land before the guest asks.
            time.sleep(0.5)


def log(text):
    print(f"host| {text}", flush=True)


ANSI = re.compile(r"\x1b\[[0-9;?]*[A-Za-z]|\x1bc|\r")


def main():
    p = argparse.ArgumentParser()
    p.add_argument("--kernel", required=True)
    p.add_argument("--initrd", required=True)
    p.add_argument("--profile", required=True)
    p.add_argument("--workdir", required=True)
    p.add_argument("--mode", default="normal")
    p.add_argument("--startup-records", type=int, default=3)
    p.add_argument("--timeout", type=int, default=300)
    a = p.parse_args()

    os.makedirs(a.workdir, exist_ok=True)
    deadline = time.time() + a.timeout
    bmc = Bmc(a.workdir, a.profile, a.startup_records)
    proxy = Proxy(bmc)
    proxy.start(deadline)
    qemu = subprocess.Popen(
        ["qemu-system-x86_64", "-M", "pc", "-smp", "1", "-m", "512", "-nographic", "-no-reboot", "-nic", "none",
         "-kernel", a.kernel, "-initrd", a.initrd,
         "-append", f"console=ttyS0 quiet loglevel=3 panic=-1 tavvm.mode={a.mode}",
         "-chardev", f"socket,id=ipmi0,host=127.0.0.1,port={proxy.port},reconnect=1",
         "-device", "ipmi-bmc-extern,id=bmc0,chardev=ipmi0", "-device", "isa-ipmi-kcs,bmc=bmc0"],
        stdin=subprocess.DEVNULL, stdout=subprocess.PIPE, stderr=subprocess.STDOUT)
    timer = threading.Timer(max(1, deadline - time.time()), qemu.kill)
    timer.start()
    status = None
    with open(os.path.join(a.workdir, "console.log"), "w") as console:
        for line in qemu.stdout:
            text = ANSI.sub("", line.decode(errors="replace")).rstrip("\n")
            console.write(text + "\n")
            if text.startswith("SeaBIOS") or text.startswith("Booting from") or not text.strip():
                continue
            print(text, flush=True)
            m = re.match(r"tav-vm: exit (\d+)", text)
            if m:
                status = int(m.group(1))
    qemu.wait()
    timed_out = not timer.is_alive() and status is None
    timer.cancel()
    bmc.close()
    if status is None:
        log("guest time-out after %d s" % a.timeout if timed_out else "guest ended without a result")
        return 1
    return status


if __name__ == "__main__":
    sys.exit(main())
