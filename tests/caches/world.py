"""A machine of the rules' own to work on: nothing of what happens here reaches the one outside.

Processes, mounts and host name space are private; /etc, /run and /var are written to a tmpfs, and the home
directory of a user made for this stands on a small volume, as do the caches of the system.
"""
import contextlib
import os
import pathlib
import shutil
import subprocess
import sys
import tempfile
import time

DAY = 86400
HOUR = 3600
MARGIN = HOUR  # how far from a limit a file's age is: no run takes so long
BLOCK = 512    # what st_blocks counts in, stat(2)
USER = 7301
SOURCE = pathlib.Path(__file__).resolve().parents[2]


class Failure(Exception):
    """Something is not as it should be; the text says what."""


def expect(condition, text):
    if not condition:
        raise Failure(text)


def run(words, check=True, **more):
    if "input" not in more:
        more.setdefault("stdin", subprocess.DEVNULL)
    done = subprocess.run([str(word) for word in words], capture_output=True, text=True, **more)
    if check and done.returncode != 0:
        raise Failure(f"{' '.join(map(str, words))}: status {done.returncode}\n{done.stdout}{done.stderr}")
    return done


def alone():
    """In name spaces of its own, with somebody to bury the processes that lost their parents."""
    if os.environ.get("SPACEKEEP_PRIVATE_MOUNTS") != "1":
        os.environ["SPACEKEEP_PRIVATE_MOUNTS"] = "1"
        os.execvp("unshare", ["unshare", "--mount", "--propagation", "private", "--pid", "--fork", "--kill-child",
                              "--mount-proc", "--ipc", sys.executable, *sys.argv])
    child = os.fork()
    while child:
        process, status = os.wait()
        if process == child:
            sys.exit(os.waitstatus_to_exitcode(status))


def until(condition, what, seconds=60):
    """Waits for it. `what` completes "there was no ..."."""
    end = time.monotonic() + seconds
    while not condition():
        expect(time.monotonic() < end, f"after {seconds} seconds there was no {what}")
        time.sleep(0.05)


def keep_writes_apart(folder, upper):
    """What is written below the folder from now on goes to `upper`."""
    for name in ("upper", "work"):
        (upper / name).mkdir(parents=True)
    run(["mount", "-t", "overlay", "-o", f"lowerdir={folder},upperdir={upper}/upper,workdir={upper}/work",
         "none", folder])


class World:
    def __init__(self, build):
        self.volume = pathlib.Path(tempfile.mkdtemp(prefix="spacekeep-caches-"))
        run(["mount", "-t", "tmpfs", "-o", "size=3G,mode=0755", "none", self.volume])
        self.tools = self.volume.with_name(self.volume.name + "-scratch")
        self.tools.mkdir()
        run(["mount", "-t", "tmpfs", "-o", "size=6G,mode=0755", "none", self.tools])
        run(["mount", "-t", "tmpfs", "-o", "mode=1777", "none", "/dev/shm"])
        for folder in ("etc", "run", "var"):
            keep_writes_apart(pathlib.Path("/") / folder, self.tools / "private" / folder)
        self.home = self.folder_of_user(self.volume / "home")
        self.work = self.folder_of_user(self.tools / "work")
        self.mounted = []
        self.versions = {}
        self.make_user()
        self.copy_programs(build)
        self.environment = {"HOME": str(self.home), "USER": "keeper", "LOGNAME": "keeper", "LC_ALL": "C.UTF-8",
                            "PATH": "/usr/local/sbin:/usr/local/bin:/usr/sbin:/usr/bin:/sbin:/bin",
                            "XDG_RUNTIME_DIR": str(self.folder_of_user(self.tools / "runtime", 0o700))}

    @staticmethod
    def folder_of_user(folder, mode=0o755):
        if not folder.parent.exists():
            World.folder_of_user(folder.parent)
        folder.mkdir(exist_ok=True)
        os.chown(folder, USER, USER)
        folder.chmod(mode)
        return folder

    def make_user(self):
        with open("/etc/passwd", "a") as passwd:
            passwd.write(f"keeper:x:{USER}:{USER}:keeper:{self.home}:/bin/sh\n")
        with open("/etc/group", "a") as group:
            group.write(f"keeper:x:{USER}:\n")

    def copy_programs(self, build):
        """To where the user may read them; the rules with all that are off switched on."""
        self.programs = self.tools / "programs"
        self.programs.mkdir()
        for program in ("services/spacekeep-command", "ctl/spacekeepctl"):
            shutil.copy(build / program, self.programs)
        shutil.copytree(SOURCE / "services/rules", self.tools / "rules")
        enabled = self.tools / "enabled"
        for rule in self.tools.glob("rules/*/*.plist"):
            (enabled / rule.parent.name).mkdir(parents=True, exist_ok=True)
            (enabled / rule.parent.name / rule.name).write_text(
                '<plist version="1.0"><dict><key>ENABLED</key><true/></dict></plist>')

    def close(self):
        for folder in reversed(self.mounted):
            run(["umount", "-l", folder])
        for folder in ("var", "run", "etc", "dev/shm"):
            run(["umount", "-l", f"/{folder}"])
        for folder in (self.tools, self.volume):
            run(["umount", "-l", folder])
            folder.rmdir()

    def system_volume(self, folder):
        """A volume of its own for a directory of the system."""
        folder = pathlib.Path(folder)
        folder.mkdir(parents=True, exist_ok=True)
        run(["mount", "-t", "tmpfs", "-o", "size=1G,mode=0755", "none", folder])
        self.mounted.append(folder)
        return folder

    def private_copy(self, folder):
        """The directory as it is, on a tmpfs: locks taken there are nobody else's."""
        copy = self.tools / "copies" / pathlib.Path(folder).name
        copy.parent.mkdir(exist_ok=True)
        run(["cp", "-a", folder, copy])
        run(["mount", "--bind", copy, folder])
        self.mounted.append(pathlib.Path(folder))

    @staticmethod
    def as_user(words):
        return ["setpriv", f"--reuid={USER}", f"--regid={USER}", "--clear-groups", "--", *map(str, words)]

    def user(self, *words, check=True, env=None, cwd=None, **more):
        """Runs a program as the user."""
        return run(self.as_user(words), check=check, env={**self.environment, **(env or {})},
                   cwd=cwd or self.home, **more)

    def unpacked(self, *packages):
        """Where the files of Debian packages are that would change this machine if they were installed."""
        place = self.tools / "unpacked"
        (archives := self.tools / "archives").mkdir(exist_ok=True)
        archives.chmod(0o777)
        run(["apt-get", "download", *packages], cwd=archives)
        for archive in archives.glob("*.deb"):
            run(["dpkg-deb", "-x", archive, place])
            name, version = run(["dpkg-deb", "-W", archive]).stdout.split()
            self.versions[name] = f"{name} {version}"
            archive.unlink()
        return place

    @contextlib.contextmanager
    def running(self, words, ready=lambda _: True, what="sign of it", user=True, env=None, cwd=None):
        """A program that runs meanwhile; `ready` is asked with its process."""
        output = open(self.tools / "running.log", "w+")
        process = subprocess.Popen(self.as_user(words) if user else [str(word) for word in words],
                                   env={**self.environment, **(env or {})}, cwd=cwd or (self.home if user else "/"),
                                   stdin=subprocess.PIPE, stdout=output, stderr=output, start_new_session=True)
        try:
            until(lambda: process.poll() is not None or ready(process), f"{what} ({words[0]})")
            output.seek(0)
            expect(process.poll() is None, f"{words} ended: {output.read()}")
            yield process
        finally:
            with contextlib.suppress(ProcessLookupError):
                os.killpg(process.pid, 9)
            process.wait()
            process.stdin.close()
            output.close()

    @contextlib.contextmanager
    def open_in_another_process(self, path, user=True, how="open"):
        """Some process has the file open, or mapped with its descriptor closed."""
        text = ("import mmap, os, sys\n"
                "f = os.open(sys.argv[1], os.O_RDONLY)\n"
                "if sys.argv[2] == 'mapped': m = mmap.mmap(f, 0, prot=mmap.PROT_READ); os.close(f)\n"
                "open(sys.argv[3], 'w').close()\nsys.stdin.read()\n")
        sign = self.work / "it-is-open"
        sign.unlink(missing_ok=True)
        with self.running(["python3", "-c", text, path, how, sign], lambda _: sign.exists(), user=user):
            yield

    def files(self, *folders):
        """All files and links below: path to (size, time of change, blocks, device and inode)."""
        found = {}
        for top in folders or [self.home, *self.mounted]:
            for folder, _, names in os.walk(top):
                for name in names:
                    facts = os.lstat(path := os.path.join(folder, name))
                    found[path] = (facts.st_size, facts.st_mtime_ns, facts.st_blocks, (facts.st_dev, facts.st_ino))
        return found

    @staticmethod
    def free_bytes(folder):
        facts = os.statvfs(folder)
        return facts.f_bavail * facts.f_frsize


def occupied_bytes(files, *folders):
    """What those of the files below the folders occupy; a file of several names counts once."""
    tops = tuple(f"{folder}/" for folder in folders)
    return sum({facts[3]: facts[2] for path, facts in files.items() if path.startswith(tops)}.values()) * BLOCK


def age(paths, days):
    """Sets when they were last read and written; `days` may be a fraction."""
    then = time.time() - days * DAY
    for path in paths:
        os.utime(path, (then, then), follow_symlinks=False)
