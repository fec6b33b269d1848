#!/usr/bin/env python3
"""Inclusive instruction counts of the entropy decoders in callgrind output.

    callgrind_costs.py vetaj   OUT MCUS   this library's MCU decoder
    callgrind_costs.py libjpeg OUT MCUS   libjpeg-turbo's decode_mcu

Prints "decoder=<Ir> calls=<n> pass=<Ir>" and, when callgrind ran with
--branch-sim=yes, "mispredicts=<Bcm + Bim>" of the decoder: inclusive costs
of the MCU decoder and of the enclosing pass (the bench's entropy loop, or
jpeg_read_coefficients).

libjpeg-turbo's decode_mcu is a static function, nameless without debug
symbols; it is then found as the callee inside libjpeg that is called exactly
once per MCU (its caller, the coefficient controller, calls nothing else per
MCU), the costliest such callee if there were several.
"""
import collections
import re
import sys


def read_calls(path):
    """Event names, and per callee: (name, object) -> [calls, inclusive costs
    by event name, caller objects]."""
    names = {"fn": {}, "ob": {}}
    events = ["Ir"]
    positions = 1
    callees = collections.defaultdict(lambda: [0, collections.Counter(), set()])
    current = {"fn": None, "ob": None}
    callee = {"fn": None, "ob": None}
    pending = None  # call count of a calls= line; its cost is on the next line
    compressed = re.compile(r"^\((\d+)\)(?: (.*))?$")

    def name_of(kind, value):
        m = compressed.match(value)
        if not m:
            return value
        if m.group(2) is not None:
            names[kind][m.group(1)] = m.group(2)
        return names[kind].get(m.group(1), value)

    with open(path, encoding="utf-8", errors="replace") as f:
        for line in f:
            line = line.rstrip("\n")
            if pending is not None:
                costs = line.split()[positions:]  # trailing zero costs may be left out
                entry = callees[(callee["fn"], callee["ob"] or current["ob"])]
                entry[0] += pending
                for event, cost in zip(events, costs):
                    entry[1][event] += int(cost)
                entry[2].add(current["ob"])
                pending = None
                continue
            if line.startswith("events:"):
                events = line.split()[1:]
                continue
            if line.startswith("positions:"):
                positions = len(line.split()) - 1
                continue
            key, sep, value = line.partition("=")
            if not sep:
                continue
            if key in ("fn", "ob"):
                current[key] = name_of(key, value)
                if key == "fn":
                    callee["ob"] = None
            elif key in ("cfn", "cob"):
                callee[key[1:]] = name_of(key[1:], value)
            elif key == "calls":
                pending = int(value.split()[0])
    return callees


def inclusive(callees, predicate):
    calls, costs = 0, collections.Counter()
    for (fn, ob), (n, c, _) in callees.items():
        if fn is not None and predicate(fn, ob):
            calls += n
            costs.update(c)
    return calls, costs


def main():
    if len(sys.argv) != 4 or sys.argv[1] not in ("vetaj", "libjpeg"):
        sys.exit(__doc__)
    side, path, mcus = sys.argv[1], sys.argv[2], int(sys.argv[3])
    callees = read_calls(path)
    if side == "vetaj":
        calls, cost = inclusive(callees, lambda fn, ob: fn.startswith("VETAJ_DecodeMcu("))
        _, total = inclusive(callees, lambda fn, ob: "vetaj_entropy_pass" in fn)
    else:
        in_lib = lambda ob: ob is not None and "libjpeg" in ob
        calls, cost = inclusive(
            callees, lambda fn, ob: in_lib(ob) and re.match(r"decode_mcu(\W|$)", fn))
        if calls == 0:
            candidates = [(c["Ir"], n, c) for (fn, ob), (n, c, callers) in callees.items()
                          if in_lib(ob) and n == mcus and any(in_lib(o) for o in callers)]
            if candidates:
                _, calls, cost = max(candidates, key=lambda t: t[0])
        _, total = inclusive(callees, lambda fn, ob: fn == "jpeg_read_coefficients")
    if calls == 0:
        sys.exit(f"callgrind_costs: no MCU decoder found in {path}")
    line = f"decoder={cost['Ir']} calls={calls} pass={total['Ir']}"
    if "Bcm" in cost or "Bim" in cost:
        line += f" mispredicts={cost['Bcm'] + cost['Bim']}"
    print(line)


if __name__ == "__main__":
    main()
