#!/usr/bin/env python3
"""KORVSNMP-MIB at snmpd's own speed: CPU and wall time per object of full
`snmpbulkwalk -Cr25` walks through private snmpd instances, on the large
appliance of examples/ (korvsnmpcd replaying large-appliance.reply.json on a
private socket, the stand-in platform describing large-appliance.host.json):

  module     snmpd with korvsnmp-snmpd.so (dlmod)
  bare-mod   snmpd with a bare handler module over as many Gauge32 objects
  subagent   snmpd and korvsnmp-agentx over AgentX
  floor      snmpd and a bare AgentX subagent over as many Gauge32 objects
  anchor     snmpd's own IF-MIB, HOST-RESOURCES-MIB and UCD-DISKIO-MIB

CPU is snmpd's and its subagent's together, utime + stime from /proc; the
instances sample once an hour, so the walks measure serving alone. A round
walks every instance in turn, walk after walk, so that all see the same load
on the machine; the ratios are those of one round, and the medians over the
rounds are printed last. Targets: module / anchor <= 1.0
(bare-mod / anchor about 0.6), subagent / floor <= 1.25.

The programs reach the private collector socket through the tests' connect
shim (libkorvtest_redirect.so), so a running collector is never touched. Run
from the top of a built tree (targets korvsnmpcd korvsnmp-agentx
korvsnmp-snmpd korvtest_redirect bare_agentx bare-snmpd):
    python3 bench/snmp_speed.py [--rounds 5] [--seconds 2] [--perf]
                                [--agentx PROGRAM] [--build DIR]
--perf records snmpd and the subagent under `perf record` during walks and
prints where their time goes; --agentx measures another korvsnmp-agentx (an
older build, say) in place of the built one.
"""
import argparse
import os
import signal
import socket
import statistics
import subprocess
import sys
import tempfile
import time

TOP = os.path.dirname(os.path.dirname(os.path.abspath(__file__)))
ARC = ".1.3.6.1.3.7947"
ANCHOR_ROOTS = [".1.3.6.1.2.1.2", ".1.3.6.1.2.1.31", ".1.3.6.1.2.1.25", ".1.3.6.1.4.1.2021.13.15"]
HZ = os.sysconf("SC_CLK_TCK")
STARTED = []  # every process started, stopped by its id at the end


def start(*args, **kwargs):
    process = subprocess.Popen(*args, **kwargs)
    STARTED.append(process)
    return process


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


def cpu_ticks(pid):
    with open("/proc/%d/stat" % pid) as f:
        fields = f.read().rsplit(")", 1)[1].split()
    return int(fields[11]) + int(fields[12])


class Instance:
    """A private snmpd with what serves its subtree: a dlmod line, or an
    AgentX subagent started beside it."""

    def __init__(self, name, scratch, env, roots, dlmod=None, subagent=None, ready=2):
        self.name, self.roots, self.env = name, roots, env
        self.port = free_port()
        self.dir = os.path.join(scratch, name)
        os.mkdir(self.dir)
        self.client_env = dict(os.environ, SNMP_PERSISTENT_DIR=self.dir + "/client")
        agentx = self.dir + "/agentx.sock"
        lines = ["agentaddress udp:127.0.0.1:%d" % self.port, "rocommunity public 127.0.0.1 -V v",
                 "dontLogTCPWrappersConnects yes"]
        lines += ["view v included %s" % root for root in roots]
        if dlmod:
            lines += ["dlmod %s %s" % dlmod, "korvsnmpInterval 3600"]
        if subagent:
            lines += ["master agentx", "agentXSocket " + agentx]
        with open(self.dir + "/snmpd.conf", "w") as f:
            f.write("\n".join(lines) + "\n")
        self.processes = [start(
            ["/usr/sbin/snmpd", "-f", "-C", "-c", self.dir + "/snmpd.conf", "-M", "", "-m", "",
             "-Lf", self.dir + "/snmpd.log"], env=dict(env, SNMP_PERSISTENT_DIR=self.dir + "/state"))]
        if subagent:
            poll(name + "'s snmpd", lambda: os.path.exists(agentx))
            self.processes.append(start(
                [arg.replace("@AGENTX@", agentx).replace("@DIR@", self.dir) for arg in subagent],
                env=env, stderr=open(self.dir + "/subagent.log", "w")))
        poll(name, lambda: self.walk(roots[0]) >= ready)  # korvsnmp's first sample taken
        self.objects = sum(self.walk(root) for root in roots)

    def walk(self, root):
        """One full walk of `root`: the number of objects."""
        out = subprocess.run(["snmpbulkwalk", "-v2c", "-c", "public", "-Cr25", "-t", "5", "-r", "0",
                              "-M", "", "-m", "", "-On", "127.0.0.1:%d" % self.port, root],
                             env=self.client_env, capture_output=True).stdout
        return out.count(b"\n") - out.count(b"No more variables")

    def ticks(self):
        return sum(cpu_ticks(p.pid) for p in self.processes)

    def measure(self, seconds):
        """CPU and wall microseconds per object of whole walks, for `seconds` at least."""
        return measure_together([self], seconds)[self.name]


def measure_together(instances, seconds):
    """Whole walks of each instance in turn, so that all see the same load on
    the machine, for `seconds` per instance at least: each one's CPU and wall
    microseconds per object."""
    cpu = {i.name: 0 for i in instances}
    wall = {i.name: 0.0 for i in instances}
    objects = {i.name: 0 for i in instances}
    walks = 0
    while walks < 3 or min(wall.values()) < seconds:
        for instance in instances:
            before, start = instance.ticks(), time.perf_counter()
            objects[instance.name] += sum(instance.walk(root) for root in instance.roots)
            wall[instance.name] += time.perf_counter() - start
            cpu[instance.name] += instance.ticks() - before
        walks += 1
    return {name: (cpu[name] * 1e6 / HZ / objects[name], wall[name] * 1e6 / objects[name])
            for name in cpu}


def profile(instance, seconds, scratch):
    """perf record of the instance's processes during walks: the share of each
    process and library, then of each function above 0.7 %."""
    data = os.path.join(scratch, "perf-%s.data" % instance.name)
    pids = ",".join(str(p.pid) for p in instance.processes)
    perf = subprocess.Popen(["perf", "record", "-q", "-o", data, "-p", pids],
                            stdout=subprocess.DEVNULL, stderr=subprocess.DEVNULL)
    time.sleep(0.5)  # perf attaches
    instance.measure(seconds)
    perf.send_signal(signal.SIGINT)
    perf.wait()
    lines = []
    for sort, limit in (("comm,dso", "1"), ("comm,dso,symbol", "0.7")):
        report = subprocess.run(["perf", "report", "-i", data, "--stdio", "--no-children",
                                 "--sort", sort, "--percent-limit", limit],
                                capture_output=True, text=True).stdout
        lines += [l.rstrip(" -") for l in report.splitlines() if l.strip() and not l.startswith("#")]
        lines.append("")
    return "\n".join(lines)


def main():
    parser = argparse.ArgumentParser()
    parser.add_argument("--rounds", type=int, default=5)
    parser.add_argument("--seconds", type=float, default=2.0, help="walking time per instance and round")
    parser.add_argument("--build", default=os.path.join(TOP, "build"))
    parser.add_argument("--agentx", help="the korvsnmp-agentx to measure (the built one)")
    parser.add_argument("--perf", action="store_true")
    options = parser.parse_args()
    build = os.path.abspath(options.build)  # snmpd reads dlmod paths from its own directory
    agentx = options.agentx or os.path.join(build, "tools/agentx/korvsnmp-agentx")

    with tempfile.TemporaryDirectory(prefix="korvsnmp-speed.") as scratch:
        collector_socket = os.path.join(scratch, "collector.sock")
        start(
            [os.path.join(build, "tools/korvsnmpcd/korvsnmpcd"), "--socket", collector_socket,
             "--replay", os.path.join(TOP, "examples/large-appliance.reply.json")],
            stderr=subprocess.DEVNULL)
        instances = []
        try:
            poll("korvsnmpcd", lambda: os.path.exists(collector_socket))
            env = dict(os.environ, LD_PRELOAD=os.path.join(build, "tests/libkorvtest_redirect.so"),
                       KORVTEST_COLLECTOR_SOCKET=collector_socket,
                       KORVPLATFORM_HOST=os.path.join(TOP, "examples/large-appliance.host.json"))
            module = Instance("module", scratch, env, [ARC],
                              dlmod=("korvsnmp", os.path.join(build, "tools/agentx/korvsnmp-snmpd.so")),
                              ready=4)
            instances.append(module)
            count = module.objects
            env["KORVBENCH_OBJECTS"] = str(count)
            instances.append(Instance("bare-mod", scratch, env, [ARC],
                                      dlmod=("barekorv", os.path.join(build, "bench/bare-snmpd.so")), ready=count))
            subagent = Instance("subagent", scratch, env, [ARC], subagent=[
                agentx, "--agentx-socket", "@AGENTX@", "--interval", "3600", "--state-dir", "@DIR@/sub"],
                ready=count)
            instances.append(subagent)
            instances.append(Instance("floor", scratch, env, [ARC],
                                      subagent=[os.path.join(build, "bench/bare_agentx"), "@AGENTX@"], ready=count))
            instances.append(Instance("anchor", scratch, env, ANCHOR_ROOTS))
            print("objects per walk: " + ", ".join("%s %d" % (i.name, i.objects) for i in instances))
            if any(i.objects != count for i in instances[:4]):
                sys.exit("the instances serve different numbers of objects")

            ratios = {"module/anchor": [], "bare-mod/anchor": [], "subagent/floor": [],
                      "module/anchor wall": [], "subagent/floor wall": []}
            print("%-6s" % "round" + "".join("%22s" % i.name for i in instances) + "   (CPU / wall, us per object)")
            for round_ in range(options.rounds):
                measured = measure_together(instances, options.seconds)
                cpu = {name: value[0] for name, value in measured.items()}
                wall = {name: value[1] for name, value in measured.items()}
                print("%-6d" % (round_ + 1) + "".join(
                    "%22s" % ("%.2f / %.2f" % (cpu[i.name], wall[i.name])) for i in instances))
                ratios["module/anchor"].append(cpu["module"] / cpu["anchor"])
                ratios["bare-mod/anchor"].append(cpu["bare-mod"] / cpu["anchor"])
                ratios["subagent/floor"].append(cpu["subagent"] / cpu["floor"])
                ratios["module/anchor wall"].append(wall["module"] / wall["anchor"])
                ratios["subagent/floor wall"].append(wall["subagent"] / wall["floor"])
            targets = {"module/anchor": 1.0, "bare-mod/anchor": 0.6, "subagent/floor": 1.25}
            print("ratios per object (CPU unless marked), median of %d rounds (each round's in brackets):" % options.rounds)
            for name, values in ratios.items():
                target = " (target %.2f)" % targets[name] if name in targets else ""
                print("  %-20s %.2f%s   [%s]" % (name, statistics.median(values), target,
                                                 " ".join("%.2f" % v for v in values)))
            if options.perf:
                for instance in (subagent, instances[3]):
                    print("\nwhere the %s's walks go (perf record of snmpd and the subagent):" % instance.name)
                    print(profile(instance, 2 * options.seconds, scratch))
        finally:
            for process in reversed(STARTED):
                if process.poll() is None:
                    process.send_signal(signal.SIGTERM)
                    process.wait()


if __name__ == "__main__":
    main()
