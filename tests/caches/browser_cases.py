"""Caches and crash reports of browsers: Firefox, Chromium."""
import os
import signal
import time

from served import served
from walk import case, play_files, version_of
from world import expect, run, until


def write_site(folder, address_file="index.html", parts=12):
    """A page of several scripts."""
    folder.mkdir()
    for i in range(parts):
        (folder / f"{i}.js").write_text(f"// {i}\n" + "var a = 1;\n" * 3000)
    scripts = "".join(f'<script src="{i}.js"></script>' for i in range(parts))
    (folder / address_file).write_text(f"<html><body>{scripts}<p>all</p></body></html>")


def crowd(name):
    """How many processes go by that name."""
    return run(["ps", "-e", "-o", "comm="], check=False).stdout.split("\n").count(name)


@case("user/firefox")
def firefox(world):
    write_site(world.tools / "site")
    cache = world.home / ".cache/mozilla"
    environment = {"MOZ_CRASHREPORTER_DISABLE": "1"}
    with served(world.tools / "site") as (address, _):

        def fill():
            (world.work / "page.png").unlink(missing_ok=True)
            world.user("firefox-esr", "--headless", "--screenshot", world.work / "page.png", f"{address}/index.html",
                       env=environment, timeout=180)
            expect((world.work / "page.png").exists(), "Firefox did not show the page")

        return play_files(world, "user/firefox", version_of(world, "firefox-esr", "--version"), cache, fill,
                          lambda path: "/cache2/entries/" in path or "/cache2/doomed/" in path, (30, 7, 1, 0),
                          kept="{others} other files in its cache directory (index, start-up cache); the profile",
                          busy=("Firefox running", world.running(
                              ["firefox-esr", "--headless", "about:blank"], env=environment,
                              ready=lambda _: crowd("firefox-esr") > 0)))


@case("user/chromium")
def chromium(world):
    write_site(world.tools / "site")
    cache = world.home / ".cache/chromium"
    words = ["chromium", "--headless", "--no-sandbox", "--disable-gpu", "--disable-dev-shm-usage", "--no-first-run",
             "--disable-component-update", f"--user-data-dir={world.home}/.config/chromium"]
    with served(world.tools / "site") as (address, _):

        def fill():
            shown = world.user(*words, "--dump-dom", f"{address}/index.html", timeout=180)
            expect("<p>all</p>" in shown.stdout, f"Chromium did not show the page: {shown.stderr[-2000:]}")

        def goes(path):
            return "_" in os.path.basename(path) and ("/Cache/Cache_Data/" in path or "/Code Cache/" in path)

        return play_files(world, "user/chromium", version_of(world, "chromium", "--version").split(" built")[0], cache,
                          fill, goes, (30, 7, 1, 0),
                          kept="{others} other files in its cache directory (indexes); the profile",
                          busy=("Chromium running", world.running(
                              [*words, "--remote-debugging-port=0", "about:blank"],
                              ready=lambda _: crowd("chromium") > 2)))


def make_firefox_crash(world, place):
    """Firefox writes its report; nothing is there to send it."""
    before = len(list(place.glob("*.extra")))
    with world.running(["firefox-esr", "--headless", "about:blank"], env={"MOZ_CRASHREPORTER": "1"},
                       ready=lambda _: list(world.home.glob(".*/**/compatibility.ini"))) as process:
        time.sleep(2)  # until it handles its own crashes
        os.kill(process.pid, signal.SIGSEGV)
        until(lambda: process.poll() is not None, "end of the process")
        until(lambda: len(list(place.glob("*.extra"))) > before, "report")
        until(lambda: crowd("crashreporter") == 0, "end of its reporter")


MEMTEST = '{"timeout":{"secs":600,"nanos":0},"mem_lock_mode":"Resizable","allow_working_set_resize":true,' \
          '"allow_multithread":true,"allow_early_termination":false}'


@case("user/crash-reports")
def crash_reports(world):
    reports = world.home / ".config/mozilla/firefox/Crash Reports"

    def fill():
        for _ in range(3):
            make_firefox_crash(world, reports / "pending")

    return play_files(world, "user/crash-reports", version_of(world, "firefox-esr", "--version"), reports, fill,
                      lambda path: path.startswith((f"{reports}/pending/", f"{reports}/submitted/")), (30, 14, 7, 3),
                      kept="{young} of the last 3 days, {others} other files beside them",
                      busy=("its reporter running", world.running(
                          ["/usr/lib/firefox-esr/crashreporter", "--memtest", "64", MEMTEST],
                          ready=lambda _: crowd("crashreporter") > 0)))
