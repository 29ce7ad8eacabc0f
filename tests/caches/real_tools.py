#!/usr/bin/env python3
"""The shipped cache rules on what the caches' own programs write.

Each case has the real tool fill its cache, ages what was written to just before and just after each limit of
the rule, and looks at each urgency: exactly what is old enough goes, what goes is what the dry run told, the
volume gains as much as was claimed, nothing else changes. What is in use stays at every urgency and
goes once nobody uses it. At the end the service check runs on a fresh fill. As root, in name spaces of its own.
"""
import argparse
import pathlib
import sys
import time

sys.dont_write_bytecode = True

import browser_cases  # noqa: E402,F401  each adds its cases to CASES
import build_cases  # noqa: E402,F401
import container_cases  # noqa: E402,F401
import desktop_cases  # noqa: E402,F401
import fetch_cases  # noqa: E402,F401
import system_cases  # noqa: E402,F401
from walk import CASES  # noqa: E402
from world import SOURCE, Failure, World, alone, expect  # noqa: E402

HEADING = ("| rule | tool | taken at urgency 1 to 4, KiB (files) | not taken at any | kept while in use, gone afterwards "
           "| dry run | service check |\n|---|---|---|---|---|---|---|")


def line_of(row):
    taken = ", ".join(f"{amount / 1024:g} ({files})" for amount, files in row.taken)
    return f"| `{row.rule}` | {row.tool} | {taken} | {row.kept} | {row.in_use} | {row.dry_run} | {row.checked} |"


def play(name, build):
    """The rule's line; a Failure tells what is wrong."""
    world = World(build)
    try:
        row = CASES[name](world)
        expect(not row.missing(), f"nothing was seen of: {', '.join(row.missing())}")
        return row
    finally:
        world.close()


def main():
    parser = argparse.ArgumentParser(description=__doc__.splitlines()[0])
    parser.add_argument("--build", type=pathlib.Path, required=True)
    parser.add_argument("names", nargs="*", metavar="RULE", help="as user/pip; all without any")
    arguments = parser.parse_args()
    shipped = sorted(f"{path.parent.name}/{path.stem}" for path in SOURCE.glob("services/rules/*/*.plist"))
    names = arguments.names or shipped
    alone()
    rows, failures = [], []
    for name in names:
        begin = time.monotonic()
        try:
            expect(name in CASES, "there is no case")
            rows.append(play(name, arguments.build.resolve()))
            print(f"{name}: ok ({time.monotonic() - begin:.0f} s)", flush=True)
        except Failure as failure:
            failures.append(name)
            print(f"{name}: FAILED: {failure}", flush=True)
    print("\n".join(["", HEADING, *map(line_of, rows), ""]))
    real = sum(row.real for row in rows)
    print(f"{len(names)} of {len(shipped)} shipped rules: {real} ok on the real tool, {len(rows) - real} ok on a part of it, "
          f"{len(failures)} failed" + (f" ({', '.join(failures)})" if failures else ""))
    return 1 if failures else 0


if __name__ == "__main__":
    sys.exit(main())
