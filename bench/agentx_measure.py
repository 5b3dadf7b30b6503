#!/usr/bin/env python3
"""Measures korvsnmp-agentx under Debian's snmpd, for the closing numbers:

- a whole-subtree walk's latency through snmpd (median, p99), with the
  collector answering and with it stalled (it takes the request and never
  answers, so the sampler waits in the library);
- the subagent's CPU time per sample, on a large reply (and, with
  --host FILE, the stand-in platform describing that host), and its resident
  memory.

The subagent reaches private collector sockets through the tests' connect
shim (build/tests/libkorvtest_redirect.so), so a running collector is never
touched. Run from the top of a built tree:
    python3 bench/agentx_measure.py [--reply FILE] [--host FILE] [--walks N]
"""
import argparse
import json
import os
import signal
import socket
import statistics
import struct
import subprocess
import sys
import tempfile
import threading
import time

TOP = os.path.dirname(os.path.dirname(os.path.abspath(__file__)))
AGENTX = os.path.join(TOP, "build/tools/agentx/korvsnmp-agentx")
COLLECTOR = os.path.join(TOP, "build/tools/korvsnmpcd/korvsnmpcd")
SHIM = os.path.join(TOP, "build/tests/libkorvtest_redirect.so")
MIBS = "/usr/share/snmp/mibs/ietf:%s/mibs/base:%s/mibs" % (TOP, TOP)
ARC = ".1.3.6.1.3.7947"


def free_port():
    with socket.socket(socket.AF_INET, socket.SOCK_DGRAM) as s:
        s.bind(("127.0.0.1", 0))
        return s.getsockname()[1]


def poll(what, check, bound=30.0):
    end = time.monotonic() + bound
    while time.monotonic() < end:
        if check():
            return
        time.sleep(0.05)
    sys.exit("%s did not come up" % what)


class Responder:
    """A collector on `path` that answers requests with `reply` (its "time"
    counting up from 1795000001); after `stall_after` answers, or always when
    `reply` is None, it takes the request and never answers."""

    def __init__(self, path, reply=None, stall_after=None):
        self.reply, self.answered, self.held = reply, 0, []
        self.stall_after = stall_after
        self.server = socket.socket(socket.AF_UNIX, socket.SOCK_STREAM)
        self.server.bind(path)
        self.server.listen(16)
        threading.Thread(target=self.serve, daemon=True).start()

    def serve(self):
        while True:
            try:
                conn, _ = self.server.accept()
            except OSError:
                return
            length = struct.unpack(">I", conn.recv(4, socket.MSG_WAITALL))[0]
            conn.recv(length, socket.MSG_WAITALL)
            if self.reply is None or self.answered == self.stall_after:
                self.held.append(conn)
                continue
            self.answered += 1
            self.reply["data"]["time"] = 1795000000 + self.answered
            body = json.dumps(self.reply, separators=(",", ":")).encode()
            conn.sendall(struct.pack(">I", len(body)) + body)
            conn.close()

    def close(self):
        self.server.close()
        for conn in self.held:
            conn.close()


def large_reply():
    def counters(name, seed):
        return {"device": name, "utilization": seed % 100, "read_access": seed * 3,
                "read_byte": seed * 4096, "write_access": seed * 5, "write_byte": seed * 8192}
    data = {
        "System": [{"user": 10, "nice": 0, "system": 5, "idle": 80, "iowait": 5, "irq": 0,
                    "softirq": 0, "steal": 0}],
        "Memory": [{"total_real": 16000000, "avail_real": 8000000, "free_real": 4000000,
                    "buffer": 1000, "cached": 100000, "total_swap": 0, "avail_swap": 0}],
        "Network": [{"device": n, "rx": i, "tx": 2 * i} for i, n in
                    enumerate(sorted(os.listdir("/sys/class/net")) +
                              ["eth%d" % i for i in range(24)] + ["bond0", "bond1", "ppp0"])],
        "DiskIO": [counters("sd%s" % chr(97 + i) if i < 26 else "sda%s" % chr(97 + i - 26), i)
                   for i in range(72)],
        "SpaceIO": [counters("dm-%d" % i, i) for i in range(64)] + [counters("total", 1)],
        "iSCSI": [counters("6001405f-0000-4000-8000-%012d" % i, i) for i in range(512)],
        "NFS": {"calls": 1, "read_byte": 2, "write_byte": 3},
        "time": 1795000000,
    }
    return {"data": data}


def exchange(path):
    """One statistics exchange with the collector on `path`: its reply."""
    with socket.socket(socket.AF_UNIX, socket.SOCK_STREAM) as s:
        s.connect(path)
        body = b'{"resource":["all"]}\n\0'
        s.sendall(struct.pack(">I", len(body)) + body)
        length = struct.unpack(">I", s.recv(4, socket.MSG_WAITALL))[0]
        return json.loads(s.recv(length, socket.MSG_WAITALL))


def cpu_ticks(pid):
    with open("/proc/%d/stat" % pid) as f:
        fields = f.read().rsplit(")", 1)[1].split()
    return int(fields[11]) + int(fields[12])


def rss_kib(pid):
    with open("/proc/%d/status" % pid) as f:
        for line in f:
            if line.startswith("VmRSS:"):
                return int(line.split()[1])
    return 0


def snmp(tool, port, *args):
    return subprocess.run([tool, "-v2c", "-c", "public", "-t", "5", "-r", "0", "-M", MIBS,
                           "-m", "KORVSNMP-MIB", "127.0.0.1:%d" % port, *args],
                          capture_output=True, text=True).stdout


def walk_latencies(port, count, tool):
    times = []
    for _ in range(count):
        start = time.perf_counter()
        out = snmp(tool, port, "korvsnmpMIB")
        times.append(time.perf_counter() - start)
        if "korvSampleTime" not in out:
            sys.exit("walk failed: " + out)
    times.sort()
    return statistics.median(times), times[min(len(times) - 1, int(len(times) * 0.99))], out.count("\n")


def main():
    parser = argparse.ArgumentParser()
    parser.add_argument("--reply", help="a collector reply (JSON) for the CPU measure")
    parser.add_argument("--host", help="a host description for the stand-in platform")
    parser.add_argument("--walks", type=int, default=200)
    parser.add_argument("--samples", type=int, default=50)
    options = parser.parse_args()

    with tempfile.TemporaryDirectory(prefix="korvsnmp-measure.") as scratch:
        port = free_port()
        conf = os.path.join(scratch, "snmpd.conf")
        with open(conf, "w") as f:
            f.write("agentaddress udp:127.0.0.1:%d\nmaster agentx\nagentXSocket %s/agentx.sock\n"
                    "view v included %s\nrocommunity public 127.0.0.1 -V v\n" % (port, scratch, ARC))
        env = dict(os.environ, SNMP_PERSISTENT_DIR=scratch + "/snmpd-state")
        children = []
        try:
            snmpd = subprocess.Popen(["/usr/sbin/snmpd", "-f", "-C", "-c", conf, "-M", "", "-m", "",
                                      "-Lf", scratch + "/snmpd.log"], env=env)
            children.append(snmpd)
            poll("snmpd", lambda: os.path.exists(scratch + "/agentx.sock"))

            def start_agentx(collector_socket, interval, host=None):
                agent_env = dict(os.environ, LD_PRELOAD=SHIM, KORVTEST_COLLECTOR_SOCKET=collector_socket)
                if host:
                    agent_env["KORVPLATFORM_HOST"] = os.path.abspath(host)
                agent = subprocess.Popen([AGENTX, "--agentx-socket", scratch + "/agentx.sock",
                                          "--interval", str(interval), "--state-dir",
                                          scratch + "/agentx-state"], env=agent_env,
                                         stderr=open(scratch + "/agentx.log", "a"))
                children.append(agent)
                return agent

            # Walk latency with the reference collector answering (1 s samples).
            collector_socket = scratch + "/collector.sock"
            collector = subprocess.Popen([COLLECTOR, "--socket", collector_socket, "--interval", "1"],
                                         stderr=subprocess.DEVNULL)
            children.append(collector)
            poll("korvsnmpcd", lambda: os.path.exists(collector_socket))
            agent = start_agentx(collector_socket, 1)
            poll("korvsnmp-agentx", lambda: "= Gauge32: 1" in snmp("snmpget", port, "korvSampleTime.0"))
            for tool in ("snmpwalk", "snmpbulkwalk"):
                median, p99, lines = walk_latencies(port, options.walks, tool)
                print("%s, collector answering (%d lines): median %.1f ms, p99 %.1f ms"
                      % (tool, lines, median * 1000, p99 * 1000))

            # Stalled: one answer (the collector's own last reply), then the
            # sampler waits in the library; snmpd still answers.
            stall_socket = scratch + "/stall.sock"
            stall = Responder(stall_socket, exchange(collector_socket), stall_after=1)
            agent.send_signal(signal.SIGTERM)
            agent.wait()
            children.remove(agent)
            collector.send_signal(signal.SIGTERM)
            collector.wait()
            children.remove(collector)
            agent = start_agentx(stall_socket, 1)
            poll("the stalled exchange", lambda: len(stall.held) > 0)
            for tool in ("snmpwalk", "snmpbulkwalk"):
                median, p99, lines = walk_latencies(port, options.walks, tool)
                print("%s, collector stalled (%d lines): median %.1f ms, p99 %.1f ms"
                      % (tool, lines, median * 1000, p99 * 1000))
            agent.send_signal(signal.SIGTERM)
            stall.close()
            agent.wait()
            children.remove(agent)

            # CPU per sample and resident memory on a large reply.
            reply = json.load(open(options.reply)) if options.reply else large_reply()
            big_socket = scratch + "/big.sock"
            big = Responder(big_socket, reply)
            agent = start_agentx(big_socket, 3600, options.host)
            poll("the first large sample", lambda: big.answered >= 1 and
                 "korvSampleTime.0 = Gauge32: 1795000001" in snmp("snmpget", port, "korvSampleTime.0"))
            before = cpu_ticks(agent.pid)
            for i in range(options.samples):
                agent.send_signal(signal.SIGHUP)
                want = "korvSampleTime.0 = Gauge32: %d" % (1795000002 + i)
                poll("sample %d" % i, lambda: want in snmp("snmpget", port, "korvSampleTime.0"))
            ticks = cpu_ticks(agent.pid) - before
            hz = os.sysconf("SC_CLK_TCK")
            objects = snmp("snmpbulkwalk", port, "korvsnmpMIB").count("\n")
            print("large reply (%d bytes, %d objects served): CPU %.1f ms per sample over %d samples;"
                  " resident memory %d KiB"
                  % (len(json.dumps(reply)), objects, ticks * 1000.0 / hz / options.samples,
                     options.samples, rss_kib(agent.pid)))
            median, p99, lines = walk_latencies(port, 20, "snmpbulkwalk")
            print("snmpbulkwalk of the large appliance (%d lines): median %.1f ms, p99 %.1f ms"
                  % (lines, median * 1000, p99 * 1000))
            big.close()
        finally:
            for child in reversed(children):
                child.send_signal(signal.SIGTERM)
                child.wait()


if __name__ == "__main__":
    main()
