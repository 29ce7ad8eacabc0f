"""Caches of package managers: npm, pip, apt, snapd."""
import contextlib
import fcntl
import hashlib
import os
import pathlib
import shutil
import subprocess
import zipfile

from served import served
from walk import Refill, Rule, case, play_files, spread, version_of
from world import SOURCE, age, expect, run, until


@case("user/npm")
def npm(world):
    packages = []
    for i in range(6):
        folder = world.folder_of_user(world.work / f"package{i}")
        (folder / "package.json").write_text(f'{{"name": "p{i}", "version": "1.0.0"}}')
        (folder / "data.bin").write_bytes(os.urandom(200_000))
        packages.append(world.work / world.user("npm", "pack", "--silent", folder, cwd=world.work).stdout.strip())
    cache = world.home / ".npm"
    row = play_files(
        world, "user/npm", "npm " + version_of(world, "npm", "--version"), cache,
        lambda: world.user("npm", "cache", "add", *packages),
        lambda path: path.startswith((f"{cache}/_cacache/content-v2/", f"{cache}/_logs/")), (60, 30, 7, 0),
        kept="{others} files of its index",
        busy=("npm running", world.running(
            ["npm", "exec", "-c", "sleep 600"],
            lambda npm: "sleep" in run(["ps", "-e", "-o", "comm="]).stdout)))
    world.user("npm", "cache", "verify")
    return row


def write_wheel(folder, name):
    with zipfile.ZipFile(folder / f"{name}-1.0-py3-none-any.whl", "w") as wheel:
        about = f"{name}-1.0.dist-info"
        wheel.writestr(f"{name}.py", os.urandom(100_000))
        wheel.writestr(f"{about}/METADATA", f"Metadata-Version: 2.1\nName: {name}\nVersion: 1.0\n")
        wheel.writestr(f"{about}/WHEEL", "Wheel-Version: 1.0\nGenerator: x\nRoot-Is-Purelib: true\nTag: py3-none-any\n")
        wheel.writestr(f"{about}/RECORD", "")


@case("user/pip")
def pip(world):
    packages = [f"package{i}" for i in range(8)]
    for name in packages:
        (folder := world.tools / "index/simple" / name).mkdir(parents=True)
        write_wheel(folder, name)
        (folder / "index.html").write_text(f'<a href="{name}-1.0-py3-none-any.whl">{name}-1.0-py3-none-any.whl</a>')
    environment = {"PIP_CONFIG_FILE": "/dev/null", "no_proxy": "127.0.0.1"}
    with served(world.tools / "index") as (address, server):

        def download(*wanted):
            # Only of a host that it trusts pip keeps what came without encryption.
            return ["/usr/bin/pip3", "download", "--quiet", "--disable-pip-version-check", "--no-deps", "--index-url",
                    f"{address}/simple", "--trusted-host", "127.0.0.1", "--dest", world.work / "downloads", *wanted]

        def fill():
            shutil.rmtree(world.work / "downloads", ignore_errors=True)
            world.user(*download(*packages), env=environment)

        cache = world.home / ".cache/pip"
        row = play_files(
            world, "user/pip", version_of(world, "/usr/bin/pip3", "--version").split(" from")[0], cache, fill,
            lambda path: path.startswith((f"{cache}/http/", f"{cache}/http-v2/", f"{cache}/wheels/")), (60, 30, 7, 0),
            kept="{others} files beside these (its look for a newer pip)",
            busy=("pip waiting for a download", world.running(
                download("never"), lambda _: server.asked_in_vain.is_set(), env=environment)))
        fill()
    return row


@contextlib.contextmanager
def record_lock(path):
    with open(path, "r+") as lock:
        fcntl.lockf(lock, fcntl.LOCK_EX)
        yield


@contextlib.contextmanager
def apt_asking():
    """apt-get that waits at its question with dpkg's locks held; the answer is no."""
    process = subprocess.Popen(["apt-get", "remove", "trash-cli"], env=dict(os.environ, LC_ALL="C"), stdin=subprocess.PIPE, stdout=subprocess.PIPE, stderr=subprocess.STDOUT)
    try:
        text = b""
        while b"[Y/n]" not in text:
            piece = os.read(process.stdout.fileno(), 4096)
            expect(piece, f"apt-get did not ask: {text.decode()}")
            text += piece
        yield
    finally:
        process.communicate(b"n\n")


@case("system/apt")
def apt(world):
    world.private_copy("/var/lib/dpkg")
    archives = world.system_volume("/var/cache/apt/archives")
    (archives / "partial").mkdir()
    quiet = dict(os.environ, DEBIAN_FRONTEND="noninteractive")
    packages = ("hello", "tree", "bc", "pv")

    def fill():
        run(["apt-get", "install", "--reinstall", "--download-only", "--yes", "--no-install-recommends", *packages],
            env=quiet)
        (archives / "partial/half.deb").write_bytes(b"x" * 100_000)

    def goes(path):
        return path.endswith(".deb") and "/partial/" not in path

    rule = Rule(world, "system/apt", archives)
    rule.row.tool = version_of(world, "apt-get", "--version").rsplit(" (", 1)[0]
    refill = Refill(rule, fill, goes)
    found = refill()
    expect(len(found) >= 4, f"downloaded {found}")
    age([archives / "partial/half.deb"], 400)
    rule.walk(spread([[path] for path in found], (30, 7, 1, 0)))
    rule.row.kept = "the half of a download in partial/, the lock"
    found = refill()
    rule.keeps_while("apt's lock held", record_lock(archives / "lock"), found)
    found = refill()
    rule.keeps_while("apt-get at its question, with dpkg's lock", apt_asking(), found)
    found = refill()
    rule.keeps_while("archive open", world.open_in_another_process(found[0], user=False), found[:1])
    refill()
    rule.check_service()
    run(["apt-get", "clean"])
    return rule.row
