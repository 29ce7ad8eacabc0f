#!/usr/bin/env python3
"""The page of "spacekeepctl report" in a real browser.

Makes pages with made-up content, opens them in Chromium without a window, and looks: that they come
up in time, load nothing, complain of nothing, show hostile names as text, say what the data says, and
can be used with a keyboard, on a phone, in the dark and on paper. The last line sums up; the status
is 1 when a check failed.
"""

import argparse
import collections
import json
import os
import subprocess
import sys
import tempfile

from browser import Browser

MOST_MILLISECONDS = 1000
PHONE = 390
LOOKS = [(width, dark) for width in (1280, PHONE) for dark in (False, True)]


class World:
    def __init__(self, sample, folder):
        self._sample = sample
        self._folder = folder

    def page(self, entries, kind=""):
        """Answers the path of a page with that many entries, and its data."""
        path = os.path.join(self._folder, f"{entries}-{kind}.html")
        if not os.path.exists(path):
            with open(path, "wb") as file:
                subprocess.run([self._sample, str(entries), kind], stdout=file, check=True)
        with open(path, encoding="utf-8") as file:
            text = file.read()
        begin = '<script type="application/json" id="data">'
        start = text.index(begin) + len(begin)
        return path, json.loads(text[start:text.index("</script>", start)])


def same(found, wanted, what):
    if found != wanted:
        raise AssertionError(f"{what}: {found!r}, not {wanted!r}")


def holds(condition, what):
    if not condition:
        raise AssertionError(what)


def size_text(amount):
    for unit in ("B", "KiB", "MiB", "GiB", "TiB"):
        if amount < 1024:
            break
        amount /= 1024
    else:
        unit = "PiB"
    return f"{int(amount)} {unit}" if unit == "B" else f"{int(amount * 10) / 10:.1f} {unit}"


def ten_thousand_entries_come_up_within_a_second(browser, world):
    path, _ = world.page(10000)
    took = []
    for width, dark in LOOKS:
        browser.look(width, dark=dark)
        took.append(browser.open(path))
    holds(max(took) < MOST_MILLISECONDS, f"{[round(one) for one in took]} ms")
    return f"{round(min(took))} to {round(max(took))} ms"


def nothing_is_loaded_and_nothing_complained_of(browser, world):
    for entries, kind in ((0, "empty"), (0, ""), (1, ""), (2, ""), (400, ""), (3000, "hostile")):
        path, _ = world.page(entries, kind)
        for width, dark in LOOKS:
            browser.look(width, dark=dark)
            browser.open(path)
        same(set(browser.loads), {"file://" + path}, "loads")
        browser.loads.clear()
    same(browser.complaints, [], "complaints")


def hostile_names_are_shown_as_text(browser, world):
    path, _ = world.page(3000, "hostile")
    browser.open(path)
    same(browser.value("document.title"), "Spacekeep report", "title")
    same(browser.value("document.querySelectorAll('img, main i:not([class]):not(.supply > i), "
                       "bdi b, bdi script').length"), 0, "elements out of names")
    same(browser.value("document.querySelectorAll('script').length"), 2, "scripts")
    text = browser.value("document.body.innerText")
    holds("</script><script>document.title='broken'</script>" in text, "a name is not shown as it is")
    holds("gpj.[U+202E]exe.photo" in text, "a turning mark is not shown by its number")
    holds("\u202e" not in text and "\u2028" not in text, "an invisible character is left")


def a_phone_needs_no_scrolling_to_the_side(browser, world):
    for entries, kind in ((400, ""), (3000, "hostile")):
        path, _ = world.page(entries, kind)
        browser.look(PHONE)
        browser.open(path)
        same(browser.value("document.documentElement.scrollWidth"), PHONE, "width")


def the_page_says_what_the_data_says(browser, world):
    path, data = world.page(400)
    browser.look()
    browser.open(path)
    purges = [one for one in data["entries"] if one["kind"] != "daily pass"]
    freed = sum(max(one.get("freed", 0), 0) for one in purges)
    lacking = sum("why" in one for one in purges)
    same(browser.value("[...document.querySelectorAll('#summary dd:nth-of-type(1)')]"
                       ".map((one) => one.textContent)")[2:], [size_text(freed), str(lacking)],
         "summary")
    by_service = collections.Counter()
    for entry in data["entries"]:
        by_service.update(entry.get("services", {}))
    name, most = by_service.most_common(1)[0]
    same(browser.value("document.querySelector('.bars li').innerText.split('\\n')"),
         [name, size_text(most)], "the first bar")
    reasons = collections.Counter(one["why"] for one in purges if "why" in one)
    first = browser.value("document.querySelector('#short strong').textContent")
    same(first, f"{reasons.most_common(1)[0][1]} of {len(purges)} purges", "the first reason")


def areas_of_the_map_are_as_the_amounts(browser, world):
    path, data = world.page(400)
    browser.look()
    browser.open(path)
    areas = browser.value(
        "[...document.querySelector('.map .group').querySelectorAll('.tile')].map((tile) => "
        "{const box = tile.getBoundingClientRect(); return box.width * box.height;})")
    volume = next(one for one in data["volumes"] if one["volume"] == "/home")
    amounts = [one["bytes"] for one in volume["offers"]["urgencies"][2]["services"]]
    same(len(areas), len(amounts), "tiles")
    for area, amount in zip(areas, sorted(amounts, reverse=True)):
        share, wanted = area / sum(areas), amount / sum(amounts)
        holds(abs(share - wanted) < 0.01, f"a tile has {share:.3f} of the area, not {wanted:.3f}")


def a_keyboard_is_enough(browser, world):
    path, data = world.page(400)
    browser.look()
    browser.open(path)
    for step in range(40):
        browser.press("Tab", 9)
        if browser.value("document.activeElement.type") == "radio":
            break
    same(browser.value("document.activeElement.value"), "3", "the chosen urgency")
    before = browser.value("document.querySelector('.map').innerText")
    browser.press("ArrowRight", 39)
    holds(browser.value("document.querySelector('.map').innerText") != before,
          "another urgency, and the same map")
    browser.value("document.querySelector('.chart svg').focus()")
    browser.press("Home", 36)
    points = [one for one in data["entries"] if one["volume"] == "/"]
    holds(browser.value("document.querySelector('.chart output').textContent")
          .endswith(size_text(points[-1]["begin"]) + " free"), "the first point is another")
    browser.value("document.querySelector('.more').focus()")
    browser.press("Enter", 13)
    same(browser.value("document.querySelectorAll('.detail').length"), 1, "opened rows")
    browser.press("Enter", 13)
    same(browser.value("document.querySelectorAll('.detail').length"), 0, "opened rows")


def every_entry_can_be_reached_and_found(browser, world):
    path, data = world.page(400)
    browser.look()
    browser.open(path)
    status = "document.querySelector('.pager [role=status]').textContent"
    click = "[...document.querySelectorAll('.pager button')].find((one) => one.textContent === '%s').click()"
    same(browser.value(status), "1 to 50 of 400 entries", "page")
    lines = browser.value("Math.max(...[...document.querySelectorAll('tbody .number')].map((cell) => {"
                          "const range = document.createRange(); range.selectNodeContents(cell);"
                          "return new Set([...range.getClientRects()].map((one) => one.top)).size;}))")
    same(lines, 1, "lines that a number takes")
    seen = 50
    while browser.value("!document.querySelectorAll('.pager button')[2].disabled"):
        browser.value(click % "Older")
        seen += browser.value("document.querySelectorAll('.entries tbody tr').length")
    same(seen, 400, "rows")
    same(browser.value(status), "351 to 400 of 400 entries", "page")
    browser.value("const short = document.querySelector('[type=checkbox]'); short.checked = true; "
                  "short.dispatchEvent(new Event('input'))")
    lacking = sum("why" in one for one in data["entries"])
    same(browser.value(status).split(" of ")[1], f"{lacking} entries", "those that fell short")
    browser.value("const search = document.querySelector('[type=search]'); "
                  "search.value = 'PHOTOS'; search.dispatchEvent(new Event('input'))")
    found = sum("why" in one and ("org.example.photos" in one.get("services", {}) or
                                  "org.example.photos" in one.get("silent", [])) for one in data["entries"])
    same(browser.value(status).split(" of ")[1], f"{found} entries", "those with photos")
    browser.value("search.value = 'nobody'; search.dispatchEvent(new Event('input'))")
    same(browser.value(status), "No entry.", "those with nobody")


def luminance(colour):
    def linear(part):
        part /= 255
        return part / 12.92 if part <= 0.03928 else ((part + 0.055) / 1.055) ** 2.4

    red, green, blue = (linear(int(colour[i:i + 2], 16)) for i in (1, 3, 5))
    return 0.2126 * red + 0.7152 * green + 0.0722 * blue


def contrast(one, other):
    light, dark = sorted((luminance(one), luminance(other)), reverse=True)
    return (light + 0.05) / (dark + 0.05)


def texts_stand_out_in_light_and_dark(browser, world):
    path, _ = world.page(2)
    pairs = [(text, ground) for text in ("text", "muted", "accent", "ok", "low", "very-low")
             for ground in ("page", "card")] + [("text", "notice")]
    pairs += [("tile-text", f"tile-{number}") for number in range(1, 9)]
    least = 99
    for dark in (False, True):
        browser.look(dark=dark)
        browser.open(path)
        for text, ground in pairs:
            colours = [browser.value("getComputedStyle(document.documentElement)"
                                     f".getPropertyValue('--{name}').trim()") for name in (text, ground)]
            ratio = contrast(*colours)
            least = min(least, ratio)
            holds(ratio >= 4.5, f"{text} on {ground}, dark {dark}: {ratio:.2f}")
    return f"at least {least:.1f} to 1"


def it_can_be_printed(browser, world):
    path, _ = world.page(400)
    browser.look(dark=True)
    browser.open(path)
    paper = path + ".pdf"
    browser.paper(paper)
    with open(paper, "rb") as file:
        holds(file.read(5) == b"%PDF-", "no PDF")
    browser.call("Emulation.setEmulatedMedia", media="print",
                 features=[{"name": "prefers-color-scheme", "value": "dark"}])
    same(browser.value("getComputedStyle(document.body).backgroundColor"), "rgb(245, 246, 248)",
         "ground on paper")
    same(browser.value("getComputedStyle(document.querySelector('.filters')).display"), "none",
         "filters on paper")


def nothing_can_be_loaded_even_if_somebody_tried(browser, world):
    path, _ = world.page(2)
    browser.open(path)
    same(browser.value("fetch('http://127.0.0.1:9/').then(() => 'loaded', () => 'refused')"), "refused",
         "fetch")
    same(browser.value("new Promise((done) => {const image = new Image();"
                       "image.onload = () => done('loaded'); image.onerror = () => done('refused');"
                       "image.src = 'data:image/gif;base64,R0lGODlhAQABAAAAACw='; })"), "refused", "image")
    browser.value("{const script = document.createElement('script'); "
                  "script.textContent = 'document.title = \"broken\"'; document.body.append(script);}")
    same(browser.value("document.title"), "Spacekeep report", "title")
    refusals = [one for one in browser.complaints if "Content Security Policy" in one]
    holds(len(refusals) >= 3, f"refusals: {refusals}")
    browser.complaints.clear()


CHECKS = [ten_thousand_entries_come_up_within_a_second, nothing_is_loaded_and_nothing_complained_of,
          hostile_names_are_shown_as_text, a_phone_needs_no_scrolling_to_the_side,
          the_page_says_what_the_data_says, areas_of_the_map_are_as_the_amounts, a_keyboard_is_enough,
          every_entry_can_be_reached_and_found, texts_stand_out_in_light_and_dark, it_can_be_printed,
          nothing_can_be_loaded_even_if_somebody_tried]


def take_pictures(world, folder):
    os.makedirs(folder, exist_ok=True)
    with Browser() as browser:
        for kind, entries in (("", 2000), ("hostile", 400), ("empty", 0)):
            for width, dark in LOOKS:
                browser.look(width, dark=dark)
                browser.open(world.page(entries, kind)[0])
                browser.look(width, min(browser.value("document.documentElement.scrollHeight"), 5000), dark)
                name = f"{kind or 'usual'}-{width}-{'dark' if dark else 'light'}.png"
                browser.picture(os.path.join(folder, name), whole=False)


def main():
    options = argparse.ArgumentParser(description=__doc__.split("\n", 1)[0])
    options.add_argument("--sample", required=True, help="the program that makes pages")
    options.add_argument("--pictures", help="folder for pictures of the page, to be looked at")
    chosen = options.parse_args()
    failed = 0
    with tempfile.TemporaryDirectory(prefix="spacekeep-report-") as folder:
        world = World(chosen.sample, folder)
        for check in CHECKS:
            name = check.__name__.replace("_", " ")
            try:
                with Browser() as browser:
                    note = check(browser, world)
                    same(browser.complaints, [], "complaints of the page")
                print(f"{name:<62} ok{f', {note}' if note else ''}", flush=True)
            except Exception as error:  # the other checks still tell something
                failed += 1
                print(f"{name:<62} FAILED: {error}", flush=True)
        if chosen.pictures:
            take_pictures(world, chosen.pictures)
    print(f"report: {len(CHECKS)} checks, {failed} failed")
    return 1 if failed else 0


if __name__ == "__main__":
    sys.exit(main())
