"""Images and runtimes: podman, docker, flatpak."""
import contextlib
import datetime
import hashlib
import io
import json
import os
import pathlib
import subprocess
import tarfile
import time

from served import served
from walk import Rule, case, version_of
from world import DAY, HOUR, USER, expect, run, until

IMAGES = {"old": 90 + HOUR / DAY, "newer": 30 + HOUR / DAY, "young": 30 - HOUR / DAY, "used": 400, "on-used": 400}


def tar_of(files):
    made = io.BytesIO()
    with tarfile.open(fileobj=made, mode="w") as archive:
        for name, content in files.items():
            entry = tarfile.TarInfo(name)
            entry.size = len(content)
            archive.addfile(entry, io.BytesIO(content))
    return made.getvalue()


def layer_of(name):
    """One file that tells whose it is, always the same."""
    return tar_of({f"content-of-{name}": hashlib.sha256(name.encode()).digest() * 20_000})


def write_image(path, name, days, layers):
    """An image as `save` writes it, made so many days ago."""
    made = (datetime.datetime.now(datetime.timezone.utc) - datetime.timedelta(days=days)).strftime("%Y-%m-%dT%H:%M:%SZ")
    digests = [hashlib.sha256(layer).hexdigest() for layer in layers]
    config = json.dumps({"architecture": "amd64", "os": "linux", "created": made, "config": {"Cmd": ["/nothing"]},
                         "rootfs": {"type": "layers", "diff_ids": [f"sha256:{digest}" for digest in digests]},
                         "history": [{"created": made, "created_by": name} for _ in layers]}).encode()
    config_name = f"{hashlib.sha256(config).hexdigest()}.json"
    manifest = [{"Config": config_name, "RepoTags": [f"localhost/{name}:latest"],
                 "Layers": [f"{digest}/layer.tar" for digest in digests]}]
    files = {f"{digest}/layer.tar": layer for digest, layer in zip(digests, layers)}
    path.write_bytes(tar_of({**files, config_name: config, "manifest.json": json.dumps(manifest).encode()}))


def is_content(path):
    return os.path.basename(path).startswith("content-of-")


@contextlib.contextmanager
def afterwards(call, *words):
    yield
    call(*words)


class Engine:
    """podman or docker, as far as they are alike."""

    def __init__(self, world, rule, call):
        self.world, self.rule, self.call = world, rule, call

    def load(self, *names):
        for name in names or IMAGES:
            layers = [layer_of("used"), layer_of(name)] if name == "on-used" else [layer_of(name)]
            write_image(path := self.world.work / f"{name}.tar", name, IMAGES[name], layers)
            path.chmod(0o644)
            self.call("load", "--quiet", "--input", path)

    def images(self):
        lines = self.call("images", "--format", "{{.Repository}}").stdout.split()
        return {line.removeprefix("localhost/") for line in lines}

    def contents(self, *names):
        """The files of these images' own layers, with what a driver without layers has copied there."""
        files = [path for path in self.world.files(self.rule.cache) if is_content(path)]
        folders = {os.path.dirname(path) for path in files if os.path.basename(path)[11:] in names}
        return [path for path in files if os.path.dirname(path) in folders]

    def play(self, busy):
        self.load()
        expected = [(), (), self.contents("old", "on-used"), self.contents("newer")]
        used = self.contents("used")
        self.call("create", "--name", "with-used", "localhost/used:latest", "/nothing")
        self.rule.walk(expected, matters=is_content)
        expect(self.images() == {"young", "used"}, f"the images left are {self.images()}")
        self.rule.row.kept = "an image made within 30 days; the layer of an image that a container uses; containers"
        self.rule.keeps_while("image of a container, 400 days old", afterwards(self.call, "rm", "with-used"),
                              filter(os.path.exists, used))
        expect(self.images() == {"young"}, f"the images left are {self.images()}")
        self.load("old")
        self.rule.keeps_while(*busy, self.contents("old"))
        self.load()
        self.rule.check_service(in_use=False)
        expect("young" in self.images(), "the check took an image made within 30 days")
        return self.rule.row


@case("system/podman-images")
def podman(world):
    cache = world.system_volume("/var/lib/containers")
    rule = Rule(world, "system/podman-images", cache, may_change=lambda path: path.startswith(str(cache)))
    rule.row.tool = run(["podman", "--version"]).stdout.strip()
    engine = Engine(world, rule, lambda *words: run(["podman", *words]))
    return engine.play(("podman running", world.running(["podman", "events"], user=False,
                                                        ready=lambda process: age_of(process) > 1)))


def age_of(process):
    """Seconds since it was seen first."""
    process.seen_at = getattr(process, "seen_at", time.monotonic())
    return time.monotonic() - process.seen_at


@case("user/podman-images")
def podman_of_user(world):
    runtime = world.folder_of_user(pathlib.Path(f"/run/user/{USER}"), 0o700)
    world.environment["XDG_RUNTIME_DIR"] = str(runtime)
    cache = world.home / ".local/share/containers"
    world.folder_of_user(cache)
    rule = Rule(world, "user/podman-images", cache, may_change=lambda path: path.startswith(str(cache)))
    rule.row.tool = version_of(world, "podman", "--version") + " (rootless)"
    engine = Engine(world, rule, lambda *words: world.user("podman", *words))
    return engine.play(("podman running", world.running(["podman", "events"],
                                                        ready=lambda process: age_of(process) > 1)))


@contextlib.contextmanager
def docker_engine(world):
    log = world.tools / "dockerd.log"
    words = ["unshare", "--net", "dockerd", "--storage-driver", "overlay2", "--iptables=false", "--bridge=none"]
    with open(log, "w") as output:
        process = subprocess.Popen(words, stdin=subprocess.DEVNULL, stdout=output, stderr=output)
    try:
        until(lambda: process.poll() is not None or run(["docker", "version"], check=False).returncode == 0, "dockerd")
        expect(process.poll() is None, f"dockerd ended: {log.read_text()[-2000:]}")
        yield
    finally:
        process.terminate()
        process.wait()


@case("system/docker-images")
def docker(world):
    cache = world.system_volume("/var/lib/docker")
    rule = Rule(world, "system/docker-images", cache, may_change=lambda path: path.startswith(str(cache)))
    with docker_engine(world):
        versions = run(["docker", "version", "--format", "{{.Server.Version}}"]).stdout.strip()
        rule.row.tool = f"Docker Engine {versions}"
        engine = Engine(world, rule, lambda *words: run(["docker", *words]))
        return engine.play(("docker running", world.running(["docker", "events"], user=False,
                                                            ready=lambda process: age_of(process) > 1)))


class Flatpak:
    """An installation, the user's or the system's, and a repository to install from."""

    def __init__(self, world, call, which):
        self.world, self.call, self.which = world, call, which
        self.repository = world.work / "flatpak-repository"
        for name in ("Needed", "Left", "Pinned", "Again"):
            self.export(f"org.example.{name}", f"[Runtime]\nname=org.example.{name}\n", "--runtime")
            self.export(f"org.example.{name}App",
                        f"[Application]\nname=org.example.{name}App\nruntime=org.example.{name}/x86_64/1\n")
        self.flatpak("remote-add", "--no-gpg-verify", "own", f"file://{self.repository}")

    def flatpak(self, command, *words):
        return self.call("flatpak", command, self.which, *words)

    def export(self, name, about, *how):
        tree = self.world.folder_of_user(self.world.work / name)
        for folder in ("files", "usr", "export"):
            self.world.folder_of_user(tree / folder)
        content = tree / ("usr" if how else "files")
        (tree / "metadata").write_text(about)
        (content / f"content-of-{name}").write_bytes(hashlib.sha256(name.encode()).digest() * 20_000)
        self.world.user("flatpak", "build-export", "--disable-sandbox", *how, self.repository, tree, "1")

    def install(self, name):
        self.flatpak("install", "--assumeyes", "--noninteractive", "own", f"org.example.{name}")

    def leave_runtime(self, name):
        """The runtime of an application that is not there any more."""
        self.install(f"{name}App")
        self.remove_app(name)

    def remove_app(self, name):
        self.flatpak("uninstall", "--assumeyes", "--noninteractive", f"org.example.{name}App")

    def runtimes(self):
        return set(self.flatpak("list", "--runtime", "--columns=application").stdout.split())


def start_system_bus():
    """flatpak asks there whether the user may install at all. It ends with this run."""
    os.makedirs("/run/dbus", exist_ok=True)
    subprocess.Popen(["dbus-daemon", "--system", "--nofork", "--nopidfile"], stdin=subprocess.DEVNULL,
                     stdout=subprocess.DEVNULL, stderr=subprocess.DEVNULL)
    until(lambda: os.path.exists("/run/dbus/system_bus_socket"), "system bus")


def play_flatpak(world, name, cache, call, which, as_user):
    start_system_bus()
    world.folder_of_user(cache) if as_user else cache.mkdir(exist_ok=True)
    rule = Rule(world, name, cache, [cache / "runtime", cache / "repo"], lambda path: path.startswith(str(cache)))
    rule.row.tool = run(["flatpak", "--version"]).stdout.strip()
    flatpak = Flatpak(world, call, which)

    def content(runtime):
        return [path for path in world.files(cache / "runtime") if path.endswith(f"/content-of-org.example.{runtime}")]

    flatpak.install("NeededApp")
    flatpak.install("Pinned")
    flatpak.leave_runtime("Left")
    expect(content("Left") and flatpak.runtimes() == {f"org.example.{n}" for n in ("Needed", "Left", "Pinned")},
           f"the runtimes are {flatpak.runtimes()}")
    rule.walk([(), (), (), content("Left")], matters=lambda path: path.startswith(f"{cache}/runtime/") and is_content(path))
    expect(flatpak.runtimes() == {"org.example.Needed", "org.example.Pinned"}, f"left are {flatpak.runtimes()}")
    rule.row.kept = "a runtime that an application needs, one that is pinned, applications"
    rule.keeps_while("runtime of an installed application", afterwards(flatpak.remove_app, "Needed"), content("Needed"))
    flatpak.leave_runtime("Again")
    with served(world.tools) as (address, server):
        flatpak.flatpak("remote-add", "--no-gpg-verify", "slow", f"file://{flatpak.repository}")
        flatpak.flatpak("remote-modify", f"--url={address}/never", "slow")
        rule.keeps_while("flatpak at work", world.running(
            ["flatpak", "remote-ls", which, "slow"], lambda _: server.asked_in_vain.is_set(), user=as_user),
            content("Again"))
        flatpak.flatpak("remote-delete", "--force", "slow")
    flatpak.leave_runtime("Left")
    rule.check_service(in_use=False)
    return rule.row


@case("user/flatpak-runtimes")
def flatpak_of_user(world):
    return play_flatpak(world, "user/flatpak-runtimes", world.home / ".local/share/flatpak", world.user, "--user", True)


@case("system/flatpak-runtimes")
def flatpak(world):
    return play_flatpak(world, "system/flatpak-runtimes", world.system_volume("/var/lib/flatpak"),
                        lambda *words: run(words), "--system", False)
