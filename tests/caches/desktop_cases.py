"""Caches of desktop programs and of any others: thumbnails, trash, fonts, everything in ~/.cache."""
import os
import shutil
import struct
import time
import zlib

from walk import Refill, Rule, case, play_files, spread, version_of
from world import DAY, HOUR, age, expect, run


@case("user/fontconfig")
def fontconfig(world):
    fonts = world.folder_of_user(world.home / ".fonts")
    for i in range(8):
        world.folder_of_user(fonts / f"family{i}")
    config = world.tools / "fonts.conf"
    config.write_text(f'<?xml version="1.0"?><fontconfig><dir>{fonts}</dir>'
                      f"<cachedir>{world.home}/.cache/fontconfig</cachedir></fontconfig>")
    return play_files(world, "user/fontconfig", version_of(world, "fc-cache", "--version"),
                      world.home / ".cache/fontconfig",
                      lambda: world.user("fc-cache", "-f", env={"FONTCONFIG_FILE": str(config)}),
                      lambda path: not path.endswith("CACHEDIR.TAG"), (90, 30, 30, 7), how="mapped",
                      kept="{young} used within 7 days, CACHEDIR.TAG")


def write_picture(path, colour):
    """A PNG of one colour, 400 by 400."""
    def chunk(kind, content):
        return struct.pack(">I", len(content)) + kind + content + struct.pack(">I", zlib.crc32(kind + content))
    row = b"\0" + bytes(colour) * 400
    path.write_bytes(b"\x89PNG\r\n\x1a\n" + chunk(b"IHDR", struct.pack(">IIBBBBB", 400, 400, 8, 2, 0, 0, 0)) +
                     chunk(b"IDAT", zlib.compress(row * 400)) + chunk(b"IEND", b""))


# The type of the last number is said: asking the service for it takes a while on a busy machine.
QUEUE = """
gdbus call --timeout 120 --session --dest org.freedesktop.thumbnails.Thumbnailer1 --object-path \
  /org/freedesktop/thumbnails/Thumbnailer1 --method org.freedesktop.thumbnails.Thumbnailer1.Queue \
  "$1" "$2" normal default 'uint32 0' >/dev/null
for i in $(seq 600); do
  [ "$(find ~/.cache/thumbnails -name '*.png' | wc -l)" -ge "$3" ] && exit 0
  sleep 0.1
done
echo 'no thumbnails were made'
exit 1
"""


@case("user/thumbnails")
def thumbnails(world):
    pictures = world.folder_of_user(world.home / "Pictures")
    names = [pictures / f"{i}.png" for i in range(12)]
    for i, name in enumerate(names):
        write_picture(name, (i * 20, 255 - i * 20, 128))
    names.append(pictures / "broken.png")
    names[-1].write_bytes(b"\x89PNG\r\n\x1a\nnothing more")
    age(names, 500)
    addresses = "[" + ",".join(f"'file://{name}'" for name in names) + "]"
    kinds = "[" + ",".join("'image/png'" for _ in names) + "]"
    return play_files(world, "user/thumbnails", version_of(world, "dpkg-query", "-W", "tumbler").replace("\t", " "),
                      world.home / ".cache/thumbnails",
                      lambda: world.user("dbus-run-session", "--", "sh", "-c", QUEUE, "sh", addresses, kinds, 12),
                      lambda _: True, (90, 30, 7, 0), kept="the pictures themselves")


def throw_away(world, bin_, name, days):
    """As trash-put does it today, and then its record as of that day."""
    path = world.folder_of_user(world.home / "Documents") / name
    path.write_bytes(os.urandom(300_000))
    os.chown(path, os.stat(world.home).st_uid, -1)
    os.utime(path, (0, 0))  # old before it was thrown away
    world.user("trash-put", path)
    record = bin_ / f"info/{name}.trashinfo"
    then = time.strftime("%Y-%m-%dT%H:%M:%S", time.localtime(time.time() - days * DAY))
    lines = [f"DeletionDate={then}" if line.startswith("DeletionDate") else line
             for line in record.read_text().splitlines()]
    record.write_text("\n".join(lines) + "\n")
    return [str(record), str(bin_ / "files" / name)]


@case("user/trash")
def trash(world):
    bin_ = world.home / ".local/share/Trash"
    rule = Rule(world, "user/trash", bin_)
    rule.row.tool = "trash-cli " + version_of(world, "trash-empty", "--version").split()[-1]

    def fill():
        return [throw_away(world, bin_, f"thrown-away-{limit}", limit + HOUR / DAY) for limit in (90, 30, 14, 7)]

    thrown = fill()
    young = throw_away(world, bin_, "thrown-away-young", 7 - HOUR / DAY)
    (bin_ / "files/without-record").write_bytes(b"x" * 50_000)
    thrown[0].append(str(bin_ / "files/without-record"))
    (world.home / "Documents/kept").write_text("x")
    rule.walk(thrown)
    expect(all(map(os.path.exists, young)), "what was thrown away within 7 days went")
    rule.row.kept = "what was thrown away within 7 days, as old as it may be itself"
    thrown = [path for each in fill() for path in each]
    rule.keeps_while("file in the trash open", world.open_in_another_process(thrown[-1]), thrown)
    shutil.rmtree(bin_)
    fill()
    rule.check_service(in_use=False)
    return rule.row


def fill_with_borg(world):
    repository = world.work / "borg"
    if not repository.exists():
        world.user("borg", "init", "--encryption=none", repository)
    world.user("borg", "create", f"{repository}::a{time.time()}", world.home / "Documents")


def fill_with_restic(world):
    repository = world.work / "restic"
    environment = {"RESTIC_PASSWORD": "x", "GOMAXPROCS": "1"}
    if not repository.exists():
        world.user("restic", "init", "--repo", repository, env=environment)
    world.user("restic", "backup", "--quiet", "--repo", repository, world.home / "Documents", env=environment)


def fill_with_black(world):
    (world.work / "a.py").write_text("a = 1\n")
    world.user("black", "--quiet", world.work / "a.py")


def fill_with_clang(world):
    """clang's cache of modules."""
    folder = world.folder_of_user(world.work / "modules")
    (folder / "module.modulemap").write_text('module m { header "m.h" }\n')
    (folder / "m.h").write_text("int m(void);\n")
    (folder / "m.c").write_text('#include "m.h"\nint n(void) { return m(); }\n')
    clang = next(name for name in ("clang", "clang-16", "clang-14") if shutil.which(name))
    world.user(clang, "-fmodules", "-fimplicit-module-maps", "-I", folder, "-c", folder / "m.c", "-o", folder / "m.o")


@case("user/user-caches")
def user_caches(world):
    (world.folder_of_user(world.home / "Documents") / "text").write_text("text\n")
    cache = world.home / ".cache"
    tools = {"borg": fill_with_borg, "restic": fill_with_restic, "black": fill_with_black, "clang": fill_with_clang}

    def fill():
        for tool in tools.values():
            tool(world)

    def folders():
        return [[path for path in world.files(cache / name)] for name in tools]

    rule = Rule(world, "user/user-caches", cache)
    rule.row.tool = ", ".join((version_of(world, "borg", "--version"), " ".join(version_of(world, "restic", "version").split()[:2]),
                               "black " + version_of(world, "black", "--version").split()[1], "clang"))
    refill = Refill(rule, fill, lambda _: True)
    refill()
    expect(all(folders()), f"filled {folders()}")
    marked = world.folder_of_user(cache / "marked")
    (marked / ".spacekeep-keep").write_text("")
    (marked / "old").write_bytes(b"x" * 50_000)
    single = cache / "single-file"
    single.write_bytes(b"x" * 50_000)
    young = world.folder_of_user(cache / "young")
    for name in ("old", "young"):
        (young / name).write_bytes(b"x" * 50_000)
    age([marked / "old", marked / ".spacekeep-keep", single, young / "old"], 400)
    age([young / "young"], 14 - HOUR / DAY)
    rule.walk(spread(folders(), (180, 90, 30, 14), young=False))
    rule.row.kept = "a directory with one file used within 14 days, one that is marked, a single file in ~/.cache"
    refill()
    paths = folders()[0]
    rule.keeps_while("one file of a directory open", world.open_in_another_process(paths[0]), paths)
    refill()
    paths = folders()[1]
    rule.keeps_while("a process in it", world.running(["sleep", "600"], cwd=os.path.dirname(paths[0])), paths)
    for path in (marked, young):
        shutil.rmtree(path, ignore_errors=True)
    fill()
    for paths in folders():
        age(paths, 400)
    largest = max(sum(os.lstat(path).st_blocks * 512 for path in paths) for paths in folders())
    rule.check_service(item_bytes=largest)
    return rule.row
