"""What the system itself leaves: the journal, core dumps, crash reports, what snapd has downloaded."""
import contextlib
import os
import pathlib
import shutil
import socket
import subprocess

from walk import Rule, ages_for, case, play_files, version_of
from world import expect, run, until

JOURNALD = "/lib/systemd/systemd-journald"
FAKETIME = next(pathlib.Path("/usr/lib").glob("*/faketime/libfaketime.so.1"), None)


@contextlib.contextmanager
def journald(days_ago):
    """The journal's daemon, whose clock shows what it was so many days ago."""
    control = pathlib.Path("/run/systemd/journal/io.systemd.journal")
    for left in pathlib.Path("/run/systemd/journal").iterdir():
        if left.is_socket():
            left.unlink()
    process = subprocess.Popen([JOURNALD], stdin=subprocess.DEVNULL, stdout=subprocess.DEVNULL, stderr=subprocess.DEVNULL,
                               env={"PATH": "/usr/bin:/bin", "LD_PRELOAD": str(FAKETIME), "FAKETIME": f"-{days_ago * 86400:.0f}s"})
    try:
        until(control.exists, "journald")
        yield process
    finally:
        process.terminate()
        process.wait()


def log_lines(count):
    with socket.socket(socket.AF_UNIX, socket.SOCK_DGRAM) as line:
        for i in range(count):
            line.sendto(f"MESSAGE=line {i}\nPRIORITY=5\n".encode(), "/run/systemd/journal/socket")
    run(["journalctl", "--sync"])


@case("system/journal")
def journal(world):
    logs = world.system_volume("/var/log/journal")
    run(["mount", "-t", "tmpfs", "-o", "mode=0755", "none", "/run"])  # its sockets
    folder = logs / pathlib.Path("/etc/machine-id").read_text().strip()
    folder.mkdir()
    pathlib.Path("/run/systemd/journal").mkdir(parents=True)
    pathlib.Path("/run/systemd/journal/flushed").touch()
    pathlib.Path("/etc/systemd/journald.conf.d").mkdir(exist_ok=True)
    pathlib.Path("/etc/systemd/journald.conf.d/own.conf").write_text("[Journal]\nStorage=persistent\nReadKMsg=no\nAudit=no\n")
    active = folder / "system.journal"

    def write_file(days_ago):
        """One archived file that begins so long ago."""
        before = set(folder.iterdir())
        with journald(days_ago):
            log_lines(2000)
            run(["journalctl", "--rotate"])
        active.unlink()  # what follows is another time
        new = set(folder.iterdir()) - before
        expect(len(new) == 1, f"journald wrote {new}")
        return [str(path) for path in new]

    rule = Rule(world, "system/journal", logs)
    rule.row.tool = version_of(world, "journalctl", "--version").split(" (")[0] + " (journald with its clock set back)"
    files = [write_file(days) for days in ages_for((90, 30, 7, 1))]
    rule.walk(files[:4])
    expect(os.path.exists(files[4][0]), "what was written within a day went")
    rule.row.kept = "entries within a day, although in an archived file"
    with journald(2) as daemon:
        stays_while_it_is_written(rule, active, daemon)
    run(["journalctl", "--directory", folder, "--quiet", "-n", "1"])
    active.unlink()
    for days in ages_for((90, 30, 7, 1)):
        write_file(days)
    rule.check_service(in_use=False)
    return rule.row


def stays_while_it_is_written(rule, active, daemon):
    log_lines(500)
    number = active.stat().st_ino
    for urgency in "1234":
        rule.once(urgency)
        log_lines(10)
        expect(active.exists() and active.stat().st_ino == number and daemon.poll() is None,
               f"urgency {urgency} took the file that journald writes")
    run(["journalctl", "--rotate"])
    expect(number in (path.stat().st_ino for path in active.parent.iterdir()), "journald did not keep its file")
    rule.once("4")
    expect([path for path in active.parent.iterdir() if path.stat().st_ino == number] == [],
           "afterwards the file should have gone")
    rule.row.in_use = "the file that journald writes, of 2 days"


@contextlib.contextmanager
def coredump_service(program):
    """The service manager's part: hands each connection to the program that stores."""
    for file, line in (("passwd", "systemd-coredump:x:7302:7302::/:/usr/sbin/nologin"), ("group", "systemd-coredump:x:7302:")):
        with open(f"/etc/{file}", "a") as accounts:
            accounts.write(line + "\n")
    address = pathlib.Path("/run/systemd/coredump")
    address.parent.mkdir(exist_ok=True)
    service = subprocess.Popen(["systemd-socket-activate", "--accept", "--seqpacket", "-l", address, program],
                               stdin=subprocess.DEVNULL, stdout=subprocess.DEVNULL, stderr=subprocess.DEVNULL)
    try:
        until(address.exists, "socket for core dumps")
        yield
        until(lambda: "systemd-coredum" not in run(["ps", "-e", "-o", "comm="]).stdout, "end of the storing")
    finally:
        service.kill()
        service.wait()


@case("system/coredumps")
def coredumps(world):
    place = world.unpacked("systemd-coredump")
    program = place / "lib/systemd/systemd-coredump"
    shutil.copy(place / "etc/systemd/coredump.conf", "/etc/systemd/coredump.conf")
    cache = world.system_volume("/var/lib/systemd/coredump")
    names = [f"crasher{i}" for i in range(6)]

    def dump(name):
        """What the kernel does when a process crashes; the number of processes with that name tells them apart."""
        victim = subprocess.Popen([shutil.copy("/bin/sleep", world.tools / name), "600"])
        core = world.tools / "core"
        run(["gcore", "-o", core, victim.pid])
        stored = len(list(cache.iterdir()))
        with open(f"{core}.{victim.pid}", "rb") as image:
            run([program, victim.pid, 0, 0, 11, 1700000000, 2**64 - 1, "host"], stdin=image)
        until(lambda: len([p for p in cache.iterdir() if not p.name.startswith(".")]) > stored, "stored core dump")
        victim.kill()
        victim.wait()

    def fill():
        with coredump_service(program):
            for name in names:
                dump(name)

    return play_files(world, "system/coredumps", world.versions["systemd-coredump"], cache, fill, lambda _: True, (14, 7, 3, 1), kept="{young} of the last day")


MAKEDUMPFILE = """#!/bin/sh
# kdump-config asks for the kernel's messages in a file, and for the memory on its standard output.
[ "$1" = --dump-dmesg ] && exec cp "$2" "$3"
for last; do :; done
exec cat "$last"
"""


@case("system/crash-reports")
def crash_reports(world):
    """By kdump-tools' own script; the memory of a kernel that crashed, and who reads it, are stand-ins."""
    script = world.unpacked("kdump-tools") / "usr/sbin/kdump-config"
    text = script.read_text().replace("vmcore_file=/proc/vmcore", f"vmcore_file={world.tools}/vmcore")
    text = text.replace("\nPATH=", f"\nPATH={world.programs}:", 1)
    expect(text.count(str(world.programs)) == 1 and text.count(f"{world.tools}/vmcore") == 1, "kdump-config has changed")
    script.write_text(text)
    (world.tools / "vmcore").write_bytes(os.urandom(200_000))
    (world.programs / "makedumpfile").write_text(MAKEDUMPFILE)
    (world.programs / "makedumpfile").chmod(0o755)
    cache = world.system_volume("/var/crash")

    def fill():
        for days in range(3):  # it names its directory by the minute
            run(["sh", script, "savecore"], env={
                "PATH": "/usr/bin:/bin", "LD_PRELOAD": str(FAKETIME), "FAKETIME": f"-{days}d"})
        (cache / "kdump_lock").write_text("1")  # as its load leaves them
        (cache / "kexec_cmd").write_text("/sbin/kexec -p")

    row = play_files(world, "system/crash-reports",
                     f"{world.versions['kdump-tools']}, its kdump-config; the crashed kernel's memory is made up",
                     cache, fill, lambda path: path.startswith(f"{cache}/2"), (30, 14, 7, 3),
                     kept="{young} of the last 3 days, kdump-config's lock and command")
    row.real = False
    return row


SNAPD = """package main

import (
	"fmt"
	"os"
	"snapstore"
)

func main() {
	cache := snapstore.NewCacheManager("/var/lib/snapd/cache", 100)
	for i := 0; i < 8; i++ {
		path := fmt.Sprintf("/var/lib/snapd/snaps/name_%d.snap", i)
		if err := os.WriteFile(path, make([]byte, 100000+i), 0600); err != nil {
			panic(err)
		}
		if err := cache.Put(fmt.Sprintf("%096d", i), path); err != nil {
			panic(err)
		}
		if i > 0 { // an old revision goes; that of name_0 stays installed
			os.Remove(path)
		}
	}
}
"""


@case("system/snap-downloads")
def snap_downloads(world):
    """snapd itself needs its store and a booted system; the code by which it fills the cache is run alone."""
    gocode = world.unpacked("golang-github-snapcore-snapd-dev", "golang-gopkg-tomb.v2-dev",
                            "golang-gopkg-yaml.v2-dev") / "usr/share/gocode"
    for package in ("snapstore", "fill"):
        (gocode / "src" / package).mkdir()
    own = (gocode / "src/github.com/snapcore/snapd/store/cache.go").read_text()
    (gocode / "src/snapstore/cache.go").write_text(own.replace("package store\n", "package snapstore\n", 1))
    (gocode / "src/fill/main.go").write_text(SNAPD)
    fill = world.tools / "fill-snapd-cache"
    run(["go", "build", "-p", "1", "-o", fill, "fill"],
        env=dict(os.environ, GO111MODULE="off", GOPATH=str(gocode), GOCACHE=str(world.tools / "go-cache")))
    world.system_volume("/var/lib/snapd")
    os.makedirs("/var/lib/snapd/snaps")
    installed = f"/var/lib/snapd/cache/{0:096d}"
    cache = pathlib.Path("/var/lib/snapd/cache")
    version = world.versions["golang-github-snapcore-snapd-dev"].split()[1]
    row = play_files(world, "system/snap-downloads", f"snapd {version}, its code of the download cache alone", cache,
                     lambda: run([fill]), lambda path: path != installed, (30, 7, 1, 0),
                     kept="the download of an installed revision (a second name of it)")
    row.real = False
    return row
