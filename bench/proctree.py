#!/usr/bin/env python3
"""Resident memory of a process and everything it started, sampled from /proc.

  proctree.py peak PID [INTERVAL]
      until PID ends: prints "peak_sum_kib hwm_sum_kib" where peak_sum is the largest
      sum of VmRSS over the tree seen at any sample and hwm_sum the sum of the last
      VmHWM (each process's own peak, kept by the kernel) of every process seen; then
      one line "hwm NAME KIB" per process and one line "cpu PROCESS THREAD SECONDS"
      per thread name (user + system time, threads of one name added up, as last seen
      before each thread ended). PID itself is left out when it is only a wrapper such
      as /usr/bin/time (--skip-root).
  proctree.py every PID SECONDS COUNT
      prints "t_s rss_kib monotonic_ns anon_kib file_kib rings_kib" for the tree every
      SECONDS, COUNT times: VmRSS, RssAnon and RssFile summed, and the resident part
      of the shared-memory rings (mappings of android-ashmem files); monotonic_ns is
      on CLOCK_MONOTONIC, the clock of the players' logs.
"""

import os
import sys
import time


def children_of():
    parent = {}
    for entry in os.listdir("/proc"):
        if not entry.isdigit():
            continue
        try:
            with open(f"/proc/{entry}/stat") as f:
                stat = f.read()
        except OSError:
            continue
        # The command name sits in parentheses and may hold spaces.
        fields = stat[stat.rfind(")") + 2:].split()
        parent[int(entry)] = int(fields[1])
    kids = {}
    for pid, ppid in parent.items():
        kids.setdefault(ppid, []).append(pid)
    return kids


def tree(root, skip_root):
    kids = children_of()
    out, stack = [], [root]
    while stack:
        pid = stack.pop()
        out.append(pid)
        stack.extend(kids.get(pid, []))
    return [p for p in out if not (skip_root and p == root)]


def status(pid):
    values = {}
    try:
        with open(f"/proc/{pid}/status") as f:
            for line in f:
                key, _, rest = line.partition(":")
                values[key] = rest.strip()
    except OSError:
        return None
    return values


def kib(value):
    return int(value.split()[0]) if value else 0


def thread_times(pid):
    """{tid: (thread name, user + system seconds)} of one process."""
    ticks = os.sysconf("SC_CLK_TCK")
    out = {}
    try:
        tids = os.listdir(f"/proc/{pid}/task")
    except OSError:
        return out
    for tid in tids:
        try:
            with open(f"/proc/{pid}/task/{tid}/stat") as f:
                stat = f.read()
        except OSError:
            continue
        name = stat[stat.find("(") + 1:stat.rfind(")")]
        fields = stat[stat.rfind(")") + 2:].split()
        out[int(tid)] = (name, (int(fields[11]) + int(fields[12])) / ticks)
    return out


def peak(root, interval, skip_root):
    best = 0
    hwm = {}
    threads = {}
    while os.path.exists(f"/proc/{root}"):
        total = 0
        for pid in tree(root, skip_root):
            st = status(pid)
            if st is None or "VmRSS" not in st:
                continue
            total += kib(st.get("VmRSS"))
            name = st.get("Name", "?")
            hwm[pid] = (name, kib(st.get("VmHWM")))
            for tid, (thread, seconds) in thread_times(pid).items():
                threads[(pid, tid)] = (name, thread, seconds)
        best = max(best, total)
        time.sleep(interval)
    print(best, sum(k for _, k in hwm.values()))
    for name, k in hwm.values():
        print("hwm", name, k)
    per_name = {}
    for name, thread, seconds in threads.values():
        per_name[(name, thread)] = per_name.get((name, thread), 0.0) + seconds
    for (name, thread), seconds in sorted(per_name.items(), key=lambda i: -i[1]):
        print("cpu", name, thread.replace(" ", "_"), f"{seconds:.2f}")


def ring_kib(pid):
    """Resident KiB of the process's mappings of shared-memory ring files."""
    total, ring = 0, False
    try:
        with open(f"/proc/{pid}/smaps") as f:
            for line in f:
                first = line.split(maxsplit=1)[0]
                if not first.endswith(":"):
                    ring = "android-ashmem" in line
                elif ring and first == "Rss:":
                    total += int(line.split()[1])
    except OSError:
        pass
    return total


def every(root, seconds, count):
    start = time.monotonic()
    for i in range(count):
        target = start + i * seconds
        time.sleep(max(0.0, target - time.monotonic()))
        if not os.path.exists(f"/proc/{root}"):
            break
        pids = tree(root, False)
        sts = [status(p) or {} for p in pids]
        total = sum(kib(st.get("VmRSS")) for st in sts)
        anon = sum(kib(st.get("RssAnon")) for st in sts)
        files = sum(kib(st.get("RssFile")) for st in sts)
        rings = sum(ring_kib(p) for p in pids)
        now = time.monotonic_ns()
        print(f"{now / 1e9 - start:.1f} {total} {now} {anon} {files} {rings}", flush=True)


def main():
    args = [a for a in sys.argv[1:] if a != "--skip-root"]
    skip_root = "--skip-root" in sys.argv
    if len(args) >= 2 and args[0] == "peak":
        peak(int(args[1]), float(args[2]) if len(args) > 2 else 0.2, skip_root)
    elif len(args) == 4 and args[0] == "every":
        every(int(args[1]), float(args[2]), int(args[3]))
    else:
        print(__doc__, file=sys.stderr)
        return 2
    return 0


if __name__ == "__main__":
    sys.exit(main())
