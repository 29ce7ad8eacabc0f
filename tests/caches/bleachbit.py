#!/usr/bin/env python3
"""The shipped rules and BleachBit on the same caches of a user: what each frees, how long it takes,
and what it took that somebody still needed. As root, in name spaces of its own.
"""
import argparse
import os
import pathlib
import shutil
import signal
import subprocess
import sys
import time

sys.dont_write_bytecode = True

from world import DAY, SOURCE, World, alone, run  # noqa: E402

SIZE = 64 * 1024
CLEANERS = ["system.cache", "thumbnails.cache", "firefox.cache", "chromium.cache", "google_chrome.cache"]
HASH = "0123456789abcdef0123456789abcdef"


def spread(folder, count, name, ages):
    """Files of one folder with their ages in days."""
    return [(f"{folder}/{name.format(i)}", ages[i * len(ages) // count]) for i in range(count)]


def layout():
    ages = (120, 40, 10, 2, 0.2)
    files = spread(".cache/thumbnails/large", 400, HASH + "{}.png", ages)
    files += spread(".cache/mozilla/firefox/a.default/cache2/entries", 400, HASH + "{}", ages)
    files += spread(".cache/chromium/Default/Cache/Cache_Data", 400, "{:016x}_0", ages)
    files += spread(".cache/pip/http-v2/a/b/c/d/e", 200, "{}.body", ages)
    files += spread(".cache/go-build/00", 200, HASH + "{}-d", ages)
    files += spread(".npm/_cacache/content-v2/sha512/aa/bb", 200, "{}", ages)
    files += spread(".cargo/registry/cache/index", 50, "crate-{}.crate", ages)
    files += spread(".cache/forgotten-program", 200, "{}", (400,))
    # What somebody still needs: used today, marked by its owner, or open (see needed()).
    files += spread(".cache/daily-program/environment/lib", 200, "{}.py", (400, 400, 400, 0.1))
    files += spread(".cache/marked-program", 50, "{}", (400,))
    files += spread(".cache/open-program", 50, "{}", (400,))
    return files


NEEDED = {"used today": ".cache/daily-program/", "marked by its owner": ".cache/marked-program/",
          "open": ".cache/open-program/", "of a browser that runs": ".cache/chromium/"}


def make(home):
    for name, days in layout():
        path = home / name
        path.parent.mkdir(parents=True, exist_ok=True)
        path.write_bytes(os.urandom(SIZE))
        then = time.time() - days * DAY
        os.utime(path, (then, then))
    (home / ".cache/marked-program/.spacekeep-keep").touch()
    run(["chown", "-R", "keeper:keeper", home])
    os.sync()


def at_work(world):
    """A program with a file open, and a browser that runs."""
    browser = world.programs / "chromium"
    if not browser.exists():
        shutil.copy("/bin/sleep", browser)
    opened = world.home / ".cache/open-program/7"
    return [subprocess.Popen(world.as_user(["sleep", "1000"]), stdin=open(opened, "rb")),
            subprocess.Popen(world.as_user([browser, "1000"]))]


def one(world, name, words, environment):
    shutil.rmtree(world.home)
    world.folder_of_user(world.home)
    make(world.home)
    before = {str(p.relative_to(world.home)) for p in world.home.rglob("*") if p.is_file()}
    free_before = world.free_bytes(world.volume)
    running = at_work(world)
    begin = time.monotonic()
    done = subprocess.run(world.as_user(words), env=environment, capture_output=True, text=True, cwd="/")
    elapsed = time.monotonic() - begin
    after = {str(p.relative_to(world.home)) for p in world.home.rglob("*") if p.is_file()}
    gained = world.free_bytes(world.volume) - free_before
    for process in running:
        process.send_signal(signal.SIGKILL)
        process.wait()
    gone = before - after
    needed = {what: sum(path.startswith(prefix) for path in gone) for what, prefix in NEEDED.items()}
    wrong = ", ".join(f"{count} {what}" for what, count in needed.items() if count) or "nothing"
    print(f"| {name} | {gained / 2**20:.1f} MiB | {len(gone)} of {len(before)} | {elapsed:.1f} s | {wrong} |", flush=True)
    if done.returncode not in (0, 1):
        print(f"{name}: status {done.returncode}: {done.stderr[-500:]}", file=sys.stderr)
    return sum(needed.values())


def main():
    parser = argparse.ArgumentParser(description=__doc__.splitlines()[0])
    parser.add_argument("--build", type=pathlib.Path, required=True)
    arguments = parser.parse_args()
    alone()
    world = World(arguments.build.resolve())
    program = world.programs / "spacekeep-command"
    rules = SOURCE / "services/rules/user"
    wrong = 0
    print("| | freed | files | time | taken of what was needed |\n|---|---|---|---|---|")
    for urgency in "1234":
        wrong += one(world, f"the rules, urgency {urgency}",
                     [program, "--rules-dir", rules, "--user", "--once", "--urgency", urgency, "--amount", "1T"],
                     {"PATH": "/usr/bin"})
    bleachbit = shutil.which("bleachbit")
    if bleachbit:
        environment = {"PATH": "/usr/sbin:/usr/bin:/sbin:/bin", "HOME": str(world.home), "LC_ALL": "C.UTF-8",
                       "USER": "keeper", "XDG_CACHE_HOME": str(world.home / ".cache")}
        one(world, "BleachBit", [bleachbit, "--clean", *CLEANERS], environment)
    else:
        print("BleachBit is not installed (apt install bleachbit)", file=sys.stderr)
    world.close()
    return 1 if wrong or not bleachbit else 0


if __name__ == "__main__":
    sys.exit(main())
