"""Caches of compilers and of what they build from: ccache, go, cargo."""
import contextlib
import fcntl
import hashlib
import json
import os
import pathlib
import shutil
import zipfile

from served import served
from walk import Refill, Rule, case, play_files, spread, version_of
from world import age, expect, run


@case("user/ccache")
def ccache(world):
    cache = world.home / ".cache/ccache"

    def is_account(path):
        return os.path.basename(path) in ("stats", "CACHEDIR.TAG", "ccache.conf") or "/lock/" in path

    def fill():
        for i in range(25):
            (world.work / f"{i}.c").write_text("\n".join(f"int f{i}_{j}(int a) {{ return a * {j}; }}" for j in range(200)))
            world.user("ccache", "gcc", "-g", "-c", world.work / f"{i}.c", "-o", world.work / f"{i}.o")

    rule = Rule(world, "user/ccache", cache, may_change=is_account)
    rule.row.tool = version_of(world, "ccache", "--version")
    refill = Refill(rule, fill, lambda path: not is_account(path))
    rule.walk(spread([[path] for path in refill()], (60, 30, 7, 1)))
    left = [path for path in world.files(cache) if not is_account(path)]
    rule.row.kept = f"{len(left)} results used within a day; its counts of hits and sizes"
    found = refill()
    rule.keeps_while("result open", world.open_in_another_process(found[0]), found)
    expect("cache_size_kibibyte" in world.user("ccache", "--print-stats").stdout, "ccache lost its account")
    results = refill()
    for number, path in enumerate(results):  # one step of its tool takes a quarter
        age([path], (100, 40, 10, 2)[number % 4])
    rule.check_service(in_use=False)
    return rule.row


def module_proxy(world, count):
    """Modules as a directory that go fetches from."""
    for number in range(count):
        name = f"example.org/m{number}"
        proxy = world.tools / f"proxy/{name}/@v"
        proxy.mkdir(parents=True)
        (proxy / "list").write_text("v1.0.0\n")
        (proxy / "v1.0.0.info").write_text('{"Version":"v1.0.0","Time":"2020-01-01T00:00:00Z"}')
        (proxy / "v1.0.0.mod").write_text(f"module {name}\n")
        module = world.tools / f"modules{number}/{name}@v1.0.0"
        module.mkdir(parents=True)
        (module / "go.mod").write_text(f"module {name}\n")
        (module / "m.go").write_text(f"package m{number}\n\n" + "// F returns its argument.\n" * 2000 +
                                     f"func F(a int) int {{ return a + {number} }}\n")
        with zipfile.ZipFile(proxy / "v1.0.0.zip", "w", zipfile.ZIP_DEFLATED) as archive:  # without directories in it
            for file in ("go.mod", "m.go"):
                archive.write(module / file, f"{name}@v1.0.0/{file}")


def module_project(world, count):
    """A module that needs them; answers its folder and the environment of go."""
    project = world.folder_of_user(world.work / "project")
    requires = "".join(f"require example.org/m{number} v1.0.0\n" for number in range(count))
    (project / "go.mod").write_text("module main\ngo 1.19\n" + requires)
    imports = "".join(f'import m{number} "example.org/m{number}"\n' for number in range(count))
    calls = " + ".join(f"m{number}.F(1)" for number in range(count))
    (project / "all.go").write_text(f"package all\n{imports}\n//go:generate sleep 600\nfunc All() int {{ return {calls} }}\n")
    run(["chown", "-R", "keeper:keeper", project])
    return project, {"GOPROXY": f"file://{world.tools}/proxy", "GOSUMDB": "off", "GOFLAGS": "-mod=mod -p=1"}


def go_at_work(world, project, environment):
    return world.running(["go", "generate", "./..."], cwd=project, env=environment,
                         ready=lambda go: "sleep" in run(["ps", "--ppid", go.pid, "-o", "comm="], check=False).stdout)


@case("user/go")
def go(world):
    module_proxy(world, 6)
    project, environment = module_project(world, 6)

    def fill():
        world.user("go", "build", "./...", cwd=project, env=environment)

    account = ("README", "trim.txt", "testexpire.txt")
    return play_files(world, "user/go", version_of(world, "go", "version"), world.home / ".cache/go-build", fill,
                      lambda path: os.path.basename(path) not in account, (5, 3, 1, 0),
                      kept="{others} files of its own account (README, trim.txt)",
                      busy=("go running", go_at_work(world, project, environment)))


@case("user/go-modules")
def go_modules(world):
    module_proxy(world, 4)
    project, environment = module_project(world, 4)
    modules = world.home / "go/pkg/mod"

    def fill():
        world.user("go", "mod", "download", cwd=project, env=environment)

    rule = Rule(world, "user/go-modules", modules)
    rule.row.tool = version_of(world, "go", "version")
    (binary := world.folder_of_user(world.home / "go/bin") / "tool").write_text("installed")
    refill = Refill(rule, fill, lambda _: True)
    refill()
    rule.walk([(), (), (), world.files(modules)])
    expect(binary.exists(), "an installed program went")
    rule.row.kept = "all, below urgency 4; programs in ~/go/bin"
    found = refill()
    rule.keeps_while("module open", world.open_in_another_process(found[0]), found)
    found = refill()
    rule.keeps_while("go running", go_at_work(world, project, environment), found)
    world.user("go", "build", "./...", cwd=project, env=environment)  # fetches them again
    refill()
    rule.check_service(in_use=False, item_bytes="100M")  # all together or nothing
    return rule.row


def crates_served(world, environment, names, folder):
    """A registry of these packages, and of one whose record never comes."""
    for name in names:
        package = world.folder_of_user(world.work / name)
        (package / "src").mkdir()
        (package / "src/lib.rs").write_text("//! Nothing.\n" * 2000)
        (package / "Cargo.toml").write_text(f'[package]\nname = "{name}"\nversion = "1.0.0"\nedition = "2021"\n'
                                            'description = "x"\nlicense = "MIT"\n')
        run(["chown", "-R", "keeper:keeper", package])
        world.user("cargo", "package", "--quiet", "--no-verify", "--allow-dirty", cwd=package, env=environment)
        archive = package / f"target/package/{name}-1.0.0.crate"
        entry = folder / name[:2] / name[2:4] / name
        entry.parent.mkdir(parents=True, exist_ok=True)
        entry.write_text(json.dumps({"name": name, "vers": "1.0.0", "deps": [], "features": {}, "yanked": False,
                                     "cksum": hashlib.sha256(archive.read_bytes()).hexdigest()}) + "\n")
        shutil.copy(archive, folder / archive.name)


def cargo_project(world, name, address, needs):
    project = world.folder_of_user(world.work / name)
    for folder in ("src", ".cargo"):
        (project / folder).mkdir()
    (project / ".cargo/config.toml").write_text(
        f'[source.crates-io]\nreplace-with = "own"\n[source.own]\nregistry = "sparse+{address}/"\n')
    (project / "src/main.rs").write_text("fn main() {}\n")
    (project / "Cargo.toml").write_text('[package]\nname = "p"\nversion = "1.0.0"\nedition = "2021"\n[dependencies]\n' +
                                        "".join(f'{need} = "1"\n' for need in needs))
    run(["chown", "-R", "keeper:keeper", project])
    return project


def own_cargo(world):
    """Where the user finds it: one in root's home directory is brought to where he may read it."""
    toolchains = sorted(pathlib.Path("/root/.rustup/toolchains").glob("*/bin"))
    if not toolchains:
        return world.environment["PATH"]
    (place := world.tools / "toolchain").mkdir()
    run(["mount", "--bind", toolchains[0].parent, place])
    return f"{place}/bin:{world.environment['PATH']}"


@contextlib.contextmanager
def locked(path):
    with open(path, "r+") as lock:
        fcntl.flock(lock, fcntl.LOCK_EX)
        yield


@case("user/cargo")
def cargo(world):
    environment = {"PATH": own_cargo(world), "CARGO_HOME": str(world.home / ".cargo")}
    world.environment.update(environment)
    cache = world.home / ".cargo/registry"
    names = ("alpha", "beta", "gamma", "delta", "epsilon")
    (folder := world.tools / "registry").mkdir()
    crates_served(world, environment, names, folder)
    with served(folder) as (address, server):
        (folder / "config.json").write_text(json.dumps({"dl": f"{address}/{{crate}}-{{version}}.crate"}))
        project = cargo_project(world, "project", address, names)
        waiting = cargo_project(world, "waiting", address, ["never"])

        def fill():
            shutil.rmtree(project / "target", ignore_errors=True)
            world.user("cargo", "check", "--quiet", cwd=project)

        rule = Rule(world, "user/cargo", cache)
        rule.row.tool = version_of(world, "cargo", "--version")
        refill = Refill(rule, fill, lambda path: path.startswith((f"{cache}/src/", f"{cache}/cache/")))

        def units():
            """Of each package the unpacked directory, then the archive of each."""
            folders = [[path for path in world.files(cache / "src") if f"/{name}-1.0.0/" in path] for name in names]
            return folders + [[path] for path in sorted(world.files(cache / "cache"))]

        refill()
        expect(len(units()) == 10 and all(units()), f"unpacked and downloaded: {units()}")
        expected = spread(units(), (90, 30, 14, 1))
        one = next(path for path in units()[0] if path.endswith("lib.rs"))
        kept = [path for path in units()[0] if path != one]
        age([one], 0.5)  # one file used today keeps its directory
        expected[0] -= {one, *kept}
        rule.walk(expected)
        rule.row.kept = "a directory with one file used today; what was used within a day; the index"
        found = refill()
        unit = [path for path in found if "/gamma-1.0.0/" in path]
        rule.keeps_while("one file of a package open", world.open_in_another_process(unit[0]), unit)
        found = refill()
        rule.keeps_while("cargo's lock held", locked(world.home / ".cargo/.package-cache"), found)
        found = refill()
        rule.keeps_while("cargo waiting for a download", world.running(
            ["cargo", "check"], cwd=waiting, ready=lambda _: server.asked_in_vain.is_set()), found)
        refill()
        rule.check_service()
        fill()
    return rule.row
