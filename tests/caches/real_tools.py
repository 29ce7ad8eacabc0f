#!/usr/bin/env python3
"""The shipped cache rules on what the caches' own programs write.

Each case has the real tool fill its cache below a home directory (or a directory of the system) that
stands on a tmpfs of this run's own, ages what was written, and then looks at each urgency: what the dry
run tells is what goes, what goes was promised, the volume gains as much as was claimed, nothing
outside of the cache changes, what is held open stays, and the tool goes on working. At the end the
service check runs on a fresh fill. As root, in a mount namespace of its own.
"""
import argparse
import contextlib
import fcntl
import functools
import hashlib
import http.server
import os
import pathlib
import shutil
import subprocess
import sys
import tempfile
import threading
import time
import zipfile

DAY = 86400
SOURCE = pathlib.Path(__file__).resolve().parents[2]
CASES = {}


def case(function):
    CASES[function.__name__.replace("_", "-")] = function
    return function


class Failure(Exception):
    pass


def expect(condition, text):
    if not condition:
        raise Failure(text)


def run(words, check=True, **more):
    more.setdefault("stdin", subprocess.DEVNULL)
    done = subprocess.run([str(word) for word in words], capture_output=True, text=True, **more)
    if check and done.returncode != 0:
        raise Failure(f"{' '.join(map(str, words))}: status {done.returncode}\n{done.stdout}{done.stderr}")
    return done


class World:
    """A volume with a home directory, and the program on it."""

    def __init__(self, build):
        self.build = build
        self.volume = pathlib.Path(tempfile.mkdtemp(prefix="spacekeep-caches-"))
        run(["mount", "-t", "tmpfs", "-o", "size=2G", "none", self.volume])
        self.home = self.volume / "home"
        self.home.mkdir()
        self.tools = self.volume.with_name(self.volume.name + "-scratch")
        self.tools.mkdir()
        passwd = self.tools / "passwd"
        lines = pathlib.Path("/etc/passwd").read_text().splitlines()
        passwd.write_text("".join(
            f"root:x:0:0:root:{self.home}:/bin/sh\n" if line.startswith("root:") else line + "\n" for line in lines))
        run(["mount", "--bind", passwd, "/etc/passwd"])
        self.environment = {k: v for k, v in os.environ.items() if not k.startswith("XDG_")}
        self.environment["HOME"] = str(self.home)

    def close(self):
        run(["umount", "/etc/passwd"])
        run(["umount", "-l", self.volume])
        self.volume.rmdir()
        shutil.rmtree(self.tools)

    def tool(self, *words, check=True, **more):
        more.setdefault("env", self.environment)
        return run(words, check=check, cwd=more.pop("cwd", self.home), **more)

    def rules(self, kind, name):
        folder = SOURCE / "services/rules" / kind
        enabled = self.tools / "enabled"
        enabled.mkdir(exist_ok=True)
        (enabled / f"{name}.plist").write_text('<plist version="1.0"><dict><key>ENABLED</key><true/></dict></plist>')
        words = ["--rules-dir", folder, "--rules-dir", enabled, "--only", name]
        return words + (["--user"] if kind == "user" else [])

    def program(self, kind, name, *words):
        environment = {k: v for k, v in self.environment.items() if k in ("PATH",)}
        done = run([self.build / "services/spacekeep-command", *self.rules(kind, name), *words],
                   check=False, env=environment)
        expect(done.returncode in (0, 1), f"spacekeep-command: {done.returncode} {done.stderr}")
        complaints = [line for line in done.stderr.splitlines() if not line.startswith(("would free", "freed"))]
        expect(not complaints, f"spacekeep-command said: {complaints}")
        return [(int(line.split("\t")[0]), line.split("\t", 1)[1]) for line in done.stdout.splitlines()]

    def free_bytes(self, folder=None):
        facts = os.statvfs(folder or self.volume)
        return facts.f_bavail * facts.f_frsize


def files_below(*folders):
    found = {}
    for folder in folders:
        for path in sorted(pathlib.Path(folder).rglob("*")):
            if path.is_file() and not path.is_symlink():
                facts = path.stat()
                found[str(path)] = (facts.st_size, facts.st_mtime_ns)
    return found


def age(paths, days):
    then = time.time() - days * DAY
    for path in paths:
        os.utime(path, (then, then), follow_symlinks=False)


def age_in_quarters(paths, days):
    """A quarter of the files each as old as an urgency asks for, from the mildest on."""
    paths = sorted(paths)
    for i, path in enumerate(paths):
        age([path], days[i * len(days) // len(paths)])


def walk_urgencies(world, kind, name, cache, most_kept=0.0, keep=lambda path: False):
    """Frees from urgency to urgency. What each took, in bytes."""
    taken = []
    everything = files_below(world.home if kind == "user" else cache)
    inside = [path for path in everything if path.startswith(str(cache) + "/")]
    for urgency in "1234":
        before, free_before = files_below(*{world.home, cache}), world.free_bytes(cache)
        foretold = world.program(kind, name, "--dry-run", "--urgency", urgency)
        expect(files_below(*{world.home, cache}) == before, f"the dry run at urgency {urgency} changed something")
        went = world.program(kind, name, "--once", "--urgency", urgency, "--amount", "1T")
        expect(went == foretold, f"urgency {urgency}: foretold {foretold}, went {went}")
        after = files_below(*{world.home, cache})
        gone = set(before) - set(after)
        expect(all(path.startswith(str(cache) + "/") and not keep(path) for path in gone), f"took {gone}")
        outside = {p: v for p, v in before.items() if not p.startswith(str(cache) + "/")}
        expect(outside == {p: after.get(p) for p in outside}, "something outside of the cache changed")
        claimed = sum(amount for amount, _ in went)
        gained = world.free_bytes(cache) - free_before
        expect(claimed <= gained and gained - claimed <= 65536, f"claimed {claimed}, the volume gained {gained}")
        taken.append(claimed)
    left = [path for path in inside if os.path.exists(path)]
    expect(len(left) <= most_kept * len(inside) + sum(map(keep, inside)), f"left at urgency 4: {left}")
    return taken


def keeps_what_is_open(world, kind, name, path):
    with open(path, "rb"):
        world.program(kind, name, "--once", "--urgency", "4", "--amount", "1T")
        expect(os.path.exists(path), f"{path} was taken while it was open")


def check_service(world, kind, name, cache, in_use=True):
    """`in_use`: whether single files that are open stay. A tool's cache stays as a whole then."""
    done = run([world.build / "ctl/spacekeepctl", "check-service", "--volume", world.volume, "--data", cache,
                *(["--in-use", cache] if in_use else []), "--yes", "--", world.build / "services/spacekeep-command",
                *world.rules(kind, name), "--check-in"], check=False,
               env={"PATH": world.environment["PATH"]})
    failed = [line for line in done.stdout.splitlines() if " FAILED" in line]
    expect(done.returncode == 0 and not failed, f"the service check: {done.stdout}{done.stderr}")
    return done.stdout.strip().splitlines()[-1]


def play(world, kind, name, fill, cache, days, **more):
    """A directory rule from its fill to its check."""
    fill()
    paths = files_below(cache)
    expect(len(paths) >= 4, f"the tool wrote only {list(paths)}")
    age_in_quarters([p for p in paths if not more.get("keep", lambda _: False)(p)], days)
    taken = walk_urgencies(world, kind, name, cache, **more)
    expect(sum(taken) > 0, "nothing was taken")
    fill()
    paths = [p for p in files_below(cache) if not more.get("keep", lambda _: False)(p)]
    age(paths, 400)
    keeps_what_is_open(world, kind, name, max(paths, key=os.path.getsize))
    fill()
    age([p for p in files_below(cache)], 400)
    return taken, check_service(world, kind, name, cache)


@case
def ccache(world):
    sources = world.tools / "c"
    sources.mkdir()

    def fill():
        for i in range(40):
            text = "\n".join(f"int f{i}_{j}(int a) {{ return a * {j}; }}" for j in range(200))
            (sources / f"{i}.c").write_text(text)
            world.tool("ccache", "gcc", "-g", "-c", sources / f"{i}.c", "-o", sources / f"{i}.o")

    fill()
    cache = world.home / ".cache/ccache"

    def keep(path):
        return os.path.basename(path) in ("stats", "CACHEDIR.TAG", "ccache.conf")

    results = sorted(p for p in files_below(cache) if not keep(p))
    expect(len(results) >= 40, f"only {len(results)} results")
    for i, path in enumerate(results):
        age([path], (100, 40, 10, 2, 0.1)[i * 5 // len(results)])
    taken = walk_urgencies(world, "user", "ccache", cache, most_kept=0.25, keep=keep)
    expect(all(taken), f"each urgency should have taken something: {taken}")
    left = [p for p in files_below(cache) if not keep(p)]
    expect(left, "what was used today should have stayed")
    fill()
    results = sorted(p for p in files_below(cache) if not keep(p))
    age(results, 100)
    keeps_what_is_open(world, "user", "ccache", results[0])
    counts = world.tool("ccache", "--print-stats").stdout
    expect("cache_size_kibibyte" in counts, counts)
    results = sorted(p for p in files_below(cache) if not keep(p))
    for i, path in enumerate(results):
        age([path], (100, 40, 10, 2)[i * 4 // len(results)])
    return taken, check_service(world, "user", "ccache", cache, in_use=False)


@case
def npm(world):
    packages = []
    for i in range(6):
        folder = world.tools / f"package{i}"
        folder.mkdir()
        (folder / "package.json").write_text(f'{{"name": "p{i}", "version": "1.0.0"}}')
        (folder / "data.bin").write_bytes(os.urandom(200_000))
        packages.append(world.tools / world.tool("npm", "pack", "--silent", folder, cwd=world.tools).stdout.strip())

    def fill():
        world.tool("npm", "cache", "add", *packages)

    cache = world.home / ".npm"
    result = play(world, "user", "npm", fill, cache, (100, 40, 10, 2),
                  keep=lambda path: not path.startswith((f"{cache}/_cacache/content-v2/", f"{cache}/_logs/")))
    world.tool("npm", "cache", "verify")
    return result


class Cacheable(http.server.SimpleHTTPRequestHandler):
    """Says of everything that it may be kept."""

    def end_headers(self):
        self.send_header("Cache-Control", "max-age=86400")
        super().end_headers()

    def log_message(self, *_):
        pass


def serve_folder(folder):
    """Its address and its server."""
    server = http.server.ThreadingHTTPServer(("127.0.0.1", 0), functools.partial(Cacheable, directory=str(folder)))
    threading.Thread(target=server.serve_forever, daemon=True).start()
    return f"http://127.0.0.1:{server.server_port}", server


@case
def pip(world):
    served = world.tools / "index"
    packages = [f"package{i}" for i in range(8)]
    for name in packages:
        folder = served / "simple" / name
        folder.mkdir(parents=True)
        with zipfile.ZipFile(folder / f"{name}-1.0-py3-none-any.whl", "w") as wheel:
            about = f"{name}-1.0.dist-info"
            wheel.writestr(f"{name}.py", os.urandom(100_000))
            wheel.writestr(f"{about}/METADATA", f"Metadata-Version: 2.1\nName: {name}\nVersion: 1.0\n")
            wheel.writestr(f"{about}/WHEEL", "Wheel-Version: 1.0\nGenerator: x\nRoot-Is-Purelib: true\nTag: py3-none-any\n")
            wheel.writestr(f"{about}/RECORD", "")
        (folder / "index.html").write_text(f'<a href="{name}-1.0-py3-none-any.whl">{name}-1.0-py3-none-any.whl</a>')
    address, server = serve_folder(served)
    environment = dict(world.environment, PIP_CONFIG_FILE="/dev/null", no_proxy="127.0.0.1", NO_PROXY="127.0.0.1")
    environment.pop("PIP_INDEX_URL", None)

    def fill():
        target = world.tools / "downloads"
        shutil.rmtree(target, ignore_errors=True)
        # Only of a host that it trusts pip keeps what came without encryption.
        world.tool("/usr/bin/python3", "-m", "pip", "download", "--quiet", "--disable-pip-version-check", "--no-deps",
                   "--index-url", f"{address}/simple", "--trusted-host", "127.0.0.1", "--dest", target, *packages,
                   env=environment)

    cache = world.home / ".cache/pip"
    result = play(world, "user", "pip", fill, cache, (100, 40, 10, 2),
                  keep=lambda path: not path.startswith((f"{cache}/http/", f"{cache}/http-v2/", f"{cache}/wheels/")))
    fill()
    server.shutdown()
    return result


def crates_served(world, environment, names):
    """A registry of these packages on this machine; answers its address and its server."""
    served = world.tools / "registry"
    for name in names:
        package = world.tools / name
        (package / "src").mkdir(parents=True)
        (package / "src/lib.rs").write_text("//! Nothing.\n" * 2000)
        (package / "Cargo.toml").write_text(f'[package]\nname = "{name}"\nversion = "1.0.0"\nedition = "2021"\n'
                                            'description = "x"\nlicense = "MIT"\n')
        world.tool("cargo", "package", "--quiet", "--no-verify", "--allow-dirty", cwd=package, env=environment)
        archive = package / f"target/package/{name}-1.0.0.crate"
        entry = served / name[:2] / name[2:4] / name
        entry.parent.mkdir(parents=True, exist_ok=True)
        entry.write_text(f'{{"name":"{name}","vers":"1.0.0","deps":[],"cksum":"'
                         f'{hashlib.sha256(archive.read_bytes()).hexdigest()}","features":{{}},"yanked":false}}\n')
        shutil.copy(archive, served / archive.name)
    address, server = serve_folder(served)
    (served / "config.json").write_text(f'{{"dl": "{address}/{{crate}}-{{version}}.crate"}}')
    return address, server


@case
def cargo(world):
    environment = dict(world.environment, CARGO_HOME=str(world.home / ".cargo"), no_proxy="127.0.0.1")
    rustup = pathlib.Path("/root/.rustup")
    if rustup.is_dir():
        environment["RUSTUP_HOME"] = str(rustup)
    names = ("alpha", "beta", "gamma")
    address, server = crates_served(world, environment, names)
    project = world.tools / "project"
    (project / "src").mkdir(parents=True)
    (project / ".cargo").mkdir()
    (project / ".cargo/config.toml").write_text(
        f'[source.crates-io]\nreplace-with = "own"\n[source.own]\nregistry = "sparse+{address}/"\n')
    (project / "src/main.rs").write_text("fn main() {}\n")
    (project / "Cargo.toml").write_text('[package]\nname = "p"\nversion = "1.0.0"\nedition = "2021"\n[dependencies]\n'
                                        + "".join(f'{name} = "1"\n' for name in names))
    cache = world.home / ".cargo/registry"

    def build(*words):
        # What is offered offline is only what is there, so this also tells what is missing.
        return world.tool("cargo", "check", "--quiet", *words, cwd=project, env=environment)

    build()
    crates = [p for p in files_below(cache / "cache")]
    units = sorted(cache.glob("src/*/*"))
    expect(len(units) == 3 and len(crates) == 3, f"unpacked {units}, downloaded {crates}")
    age(files_below(cache / "src"), 40)
    age(files_below(units[0]), 100)
    age([next(iter(files_below(units[2])))], 0.2)  # used today: all of it stays
    age(crates, 0.2)
    taken = walk_urgencies(world, "user", "cargo", cache, most_kept=1.0)
    expect(taken[0] > 0 and taken[1] > 0 and taken[2:] == [0, 0], f"{taken}")
    expect([unit.exists() for unit in units] == [False, False, True], "the wrong directories went")
    shutil.rmtree(project / "target")
    build("--offline")  # unpacks again what had gone as a whole
    expect(all(unit.exists() for unit in units), "cargo did not unpack again")
    age(files_below(cache), 400)
    keeps_what_is_open(world, "user", "cargo", next(iter(files_below(units[1]))))
    build()
    age(files_below(cache), 400)
    checked = check_service(world, "user", "cargo", cache)
    server.shutdown()
    return taken, checked


@case
def go(world):
    project = world.tools / "gomain"
    project.mkdir()
    (project / "main.go").write_text('package main\nimport _ "example.org/m"\nfunc main() {}\n')
    proxy = world.tools / "proxy/example.org/m/@v"
    proxy.mkdir(parents=True)
    (proxy / "list").write_text("v1.0.0\n")
    (proxy / "v1.0.0.info").write_text('{"Version":"v1.0.0","Time":"2020-01-01T00:00:00Z"}')
    (proxy / "v1.0.0.mod").write_text("module example.org/m\n")
    module = world.tools / "module/example.org/m@v1.0.0"
    module.mkdir(parents=True)
    (module / "go.mod").write_text("module example.org/m\n")
    (module / "m.go").write_text("package m\n")
    shutil.make_archive(str(proxy / "v1.0.0"), "zip", world.tools / "module")
    (project / "go.mod").write_text("module main\ngo 1.19\nrequire example.org/m v1.0.0\n")
    environment = dict(world.environment, GOPROXY=f"file://{world.tools}/proxy", GOSUMDB="off", GOFLAGS="-mod=mod")

    def fill():
        world.tool("go", "build", "-o", world.tools / "main", ".", cwd=project, env=environment)

    cache = world.home / ".cache/go-build"
    result = play(world, "user", "go", fill, cache, (6, 4, 2, 0.5),
                  keep=lambda path: os.path.basename(path) in ("README", "trim.txt", "testexpire.txt"))
    fill()
    modules = world.home / "go/pkg/mod"
    expect(files_below(modules), "no module was downloaded")
    taken = walk_urgencies(world, "user", "go-modules", modules)
    expect(taken[:3] == [0, 0, 0] and taken[3] > 0, f"modules: {taken}")
    fill()
    return result[0] + taken[3:], result[1]


@case
def fontconfig(world):
    fonts = world.home / ".fonts"
    for i in range(8):
        (fonts / f"family{i}").mkdir(parents=True)
    config = world.tools / "fonts.conf"
    config.write_text(f'<?xml version="1.0"?><fontconfig><dir>{fonts}</dir>'
                      f"<cachedir>{world.home}/.cache/fontconfig</cachedir></fontconfig>")

    def fill():
        world.tool("fc-cache", "-f", env=dict(world.environment, FONTCONFIG_FILE=str(config)))

    return play(world, "user", "fontconfig", fill, world.home / ".cache/fontconfig", (100, 40, 40, 10),
                keep=lambda path: path.endswith("CACHEDIR.TAG"))


@case
def trash(world):
    documents = world.home / "Documents"
    documents.mkdir()
    bin_ = world.home / ".local/share/Trash"

    def fill():
        for days in (100, 40, 20, 10, 1):
            path = documents / f"thrown-away-{days}-days-ago"
            path.write_bytes(os.urandom(300_000))
            os.utime(path, (0, 0))  # old before it was thrown away
            world.tool("trash-put", path)
            info = bin_ / f"info/{path.name}.trashinfo"
            then = time.strftime("%Y-%m-%dT%H:%M:%S", time.localtime(time.time() - days * DAY))
            lines = [f"DeletionDate={then}" if line.startswith("DeletionDate") else line
                     for line in info.read_text().splitlines()]
            info.write_text("\n".join(lines) + "\n")

    fill()
    (documents / "kept").write_text("x")
    taken = walk_urgencies(world, "user", "trash", bin_, most_kept=0.2)
    expect(all(300_000 <= each < 400_000 for each in taken), f"one file for each urgency: {taken}")
    expect((bin_ / "files/thrown-away-1-days-ago").exists(), "what was thrown away yesterday went")
    shutil.rmtree(bin_)
    fill()
    return taken, check_service(world, "user", "trash", bin_, in_use=False)


@contextlib.contextmanager
def volume_on(world, folder):
    run(["mkdir", "-p", folder])
    run(["mount", "-t", "tmpfs", "-o", "size=500M", "none", folder])
    try:
        yield
    finally:
        run(["umount", "-l", folder])


@case
def apt(world):
    archives = pathlib.Path("/var/cache/apt/archives")
    with volume_on(world, archives):
        (archives / "partial").mkdir()
        for package in ("hello", "tree", "bc", "pv"):
            run(["apt-get", "install", "--reinstall", "--download-only", "--yes", "--no-install-recommends", package],
                env=dict(os.environ, DEBIAN_FRONTEND="noninteractive"))
        packages = sorted(p for p in files_below(archives) if p.endswith(".deb"))
        expect(len(packages) >= 4, f"downloaded {packages}")
        age_in_quarters(packages, (40, 10, 2, 0.1))
        with open(archives / "lock", "r+") as lock:
            fcntl.lockf(lock, fcntl.LOCK_EX)
            # Nobody but this process's own kind may be asked: the program is another one.
            expect(world.program("system", "apt", "--dry-run", "--urgency", "4") == [], "the lock was not respected")
            expect(world.program("system", "apt", "--once", "--urgency", "4", "--amount", "1T") == [], "the lock ...")
        taken = walk_urgencies(world, "system", "apt", archives,
                               keep=lambda path: os.path.basename(path) == "lock")
        expect(all(taken), f"each urgency should have taken something: {taken}")
        run(["apt-get", "clean"])
    return taken, "not checked as a service here"


@case
def journal(world):
    logs = pathlib.Path("/var/log/journal")
    machine = pathlib.Path("/etc/machine-id").read_text().strip()
    remote = "/lib/systemd/systemd-journal-remote"
    with volume_on(world, logs):
        folder = logs / machine
        folder.mkdir()
        for number, days in enumerate((100, 40, 10, 2, 0.1)):
            began = int((time.time() - days * DAY) * 1e6)
            entries = "".join(
                f"__REALTIME_TIMESTAMP={began + i}\n__MONOTONIC_TIMESTAMP={i}\n_BOOT_ID={machine}\nMESSAGE=line {i}\n\n"
                for i in range(2000))
            plain = folder / "remote.journal"
            run([remote, f"--output={plain}", "-"], stdin=None, input=entries)
            plain.rename(folder / f"system@{machine}-{number * 2000 + 1:016x}-{began:016x}.journal")
        active = folder / "system.journal"
        shutil.copy(next(folder.glob("system@*")), active)
        taken = walk_urgencies(world, "system", "journal", logs, keep=lambda path: path == str(active), most_kept=0.2)
        expect(all(taken), f"one file for each urgency: {taken}")
        expect(len(list(folder.glob("system@*"))) == 1, "today's file should have stayed")
        run(["journalctl", "--directory", folder, "--quiet", "-n", "1"])
    return taken, "not checked as a service here"


def main():
    parser = argparse.ArgumentParser(description=__doc__.splitlines()[0])
    parser.add_argument("--build", type=pathlib.Path, required=True)
    parser.add_argument("names", nargs="*", metavar="CASE", help=", ".join(CASES))
    arguments = parser.parse_args()
    if os.environ.get("SPACEKEEP_PRIVATE_MOUNTS") != "1":
        os.environ["SPACEKEEP_PRIVATE_MOUNTS"] = "1"
        os.execvp("unshare", ["unshare", "--mount", "--propagation", "private", sys.executable, *sys.argv])
    failures = []
    names = arguments.names or list(CASES)
    for name in names:
        world = World(arguments.build.resolve())
        begin = time.monotonic()
        try:
            taken, checked = CASES[name](world)
            print(f"{name:12} ok, bytes taken at each urgency: {taken}; {checked} "
                  f"({time.monotonic() - begin:.0f} s)", flush=True)
        except Failure as failure:
            failures.append(name)
            print(f"{name:12} FAILED: {failure}", flush=True)
        finally:
            world.close()
    print(f"{len(names)} caches of real tools: {len(names) - len(failures)} ok, {len(failures)} failed"
          + (f" ({', '.join(failures)})" if failures else ""))
    return 1 if failures else 0


if __name__ == "__main__":
    sys.exit(main())
