#!/usr/bin/env python3
"""A lossy, late link between two network namespaces, for machines whose kernel has no netem.

    tools/lossy_link.py NS_A ADDR_A NS_B ADDR_B [--loss PERCENT] [--delay MS] [--jitter MS]

Makes a TUN device in each of the two named namespaces (`ip netns add`), gives them the two
addresses (a point-to-point pair) and carries every IP packet across, each way on its own:
PERCENT of them are dropped, the rest delivered after DELAY +- JITTER ms (uniform, so packets
overtake one another as they do on a real jittery link). TCP and UDP alike, so a stream over
TCP and one over UDP cross the same link; --drop-udp lets TCP only through.
Runs until killed; needs root.
"""
import argparse
import ctypes
import fcntl
import heapq
import os
import random
import select
import struct
import subprocess
import sys
import time

CLONE_NEWNET = 0x40000000
TUNSETIFF = 0x400454CA
IFF_TUN = 0x0001
IFF_NO_PI = 0x1000
NAME = "lossy0"

libc = ctypes.CDLL(None, use_errno=True)


def enter(namespace):
    fd = os.open("/var/run/netns/" + namespace, os.O_RDONLY)
    try:
        if libc.setns(fd, CLONE_NEWNET) != 0:
            raise OSError(ctypes.get_errno(), "setns " + namespace)
    finally:
        os.close(fd)


def tun_in(namespace, address, peer):
    """A TUN device in `namespace`, up with `address` and a route to `peer` through it."""
    enter(namespace)
    fd = os.open("/dev/net/tun", os.O_RDWR)
    fcntl.ioctl(fd, TUNSETIFF, struct.pack("16sH", NAME.encode(), IFF_TUN | IFF_NO_PI))
    # The device belongs to the namespace it was made in, whatever this process enters later.
    for cmd in (["ip", "addr", "add", address, "peer", peer, "dev", NAME],
                ["ip", "link", "set", NAME, "up"],
                ["ip", "link", "set", "lo", "up"]):
        subprocess.run(cmd, check=True)
    os.set_blocking(fd, False)
    return fd


def main():
    p = argparse.ArgumentParser(description=__doc__.splitlines()[0])
    p.add_argument("ns_a")
    p.add_argument("addr_a")
    p.add_argument("ns_b")
    p.add_argument("addr_b")
    p.add_argument("--loss", type=float, default=2.0, help="percent of packets dropped")
    p.add_argument("--delay", type=float, default=15.0, help="one-way delay, ms")
    p.add_argument("--jitter", type=float, default=5.0, help="+- this many ms, uniform")
    p.add_argument("--seed", type=int, default=None)
    p.add_argument("--drop-udp", action="store_true",
                   help="lose every UDP datagram (a network that lets only TCP through)")
    args = p.parse_args()
    rng = random.Random(args.seed)
    home = os.open("/proc/self/ns/net", os.O_RDONLY)
    a = tun_in(args.ns_a, args.addr_a, args.addr_b)
    b = tun_in(args.ns_b, args.addr_b, args.addr_a)
    libc.setns(home, CLONE_NEWNET)
    other = {a: b, b: a}
    due = []  # (time, order, fd, packet)
    order = 0
    counts = {"carried": 0, "dropped": 0}
    print("lossy_link: %s %s <-> %s %s, %.1f%% lost, %.0f +- %.0f ms" %
          (args.ns_a, args.addr_a, args.ns_b, args.addr_b, args.loss, args.delay, args.jitter),
          flush=True)
    try:
        while True:
            now = time.monotonic()
            while due and due[0][0] <= now:
                _, _, fd, packet = heapq.heappop(due)
                try:
                    os.write(fd, packet)
                except BlockingIOError:
                    counts["dropped"] += 1  # the device's queue is full: as a router would
            timeout = max(0.0, due[0][0] - now) if due else 0.5
            readable, _, _ = select.select([a, b], [], [], timeout)
            for fd in readable:
                for _ in range(64):
                    try:
                        packet = os.read(fd, 65536)
                    except BlockingIOError:
                        break
                    # IPv4's protocol field: 17 is UDP.
                    udp = len(packet) > 9 and packet[0] >> 4 == 4 and packet[9] == 17
                    if (args.drop_udp and udp) or rng.random() * 100 < args.loss:
                        counts["dropped"] += 1
                        continue
                    delay = max(0.0, args.delay + rng.uniform(-args.jitter, args.jitter)) / 1000
                    order += 1
                    counts["carried"] += 1
                    heapq.heappush(due, (time.monotonic() + delay, order, other[fd], packet))
    except KeyboardInterrupt:
        pass
    finally:
        print("lossy_link: %(carried)d packets carried, %(dropped)d dropped" % counts,
              file=sys.stderr, flush=True)


if __name__ == "__main__":
    main()
