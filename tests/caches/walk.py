"""What is looked at with every rule, and the line of the table that it makes."""
import dataclasses
import os

from world import DAY, MARGIN, age, expect, occupied_bytes, run

EVERYTHING = "1T"
CASES = {}


def case(rule):
    """Of which shipped rule it is the case, as "user/pip"."""
    def add(function):
        CASES[rule] = function
        return function
    return add


def version_of(world, *words, line=0):
    """What a tool says of its own version."""
    done = world.user(*words, check=False)
    return (done.stdout + done.stderr).strip().splitlines()[line]


@dataclasses.dataclass
class Row:
    """One rule's line. A cell that stays empty is a failure."""
    rule: str
    tool: str = ""             # with its version; says so where it is a stand-in
    real: bool = True          # whether the whole tool filled the cache, with nothing made up
    taken: list = dataclasses.field(default_factory=list)  # (bytes, files) for each urgency
    kept: str = ""             # what was there and did not go at any urgency
    in_use: str = ""           # what was in use, was kept, and went afterwards
    dry_run: str = ""
    checked: str = ""

    def missing(self):
        empty = [name for name in ("tool", "kept", "in_use", "dry_run", "checked") if not getattr(self, name)]
        return empty + ([] if len(self.taken) == 4 else ["taken"])


class Rule:
    """A shipped rule, and the world that it is used in."""

    def __init__(self, world, name, cache, measured=None, may_change=lambda path: False):
        self.world, self.name, self.cache = world, name, cache
        self.kind, self.file = name.split("/")
        self.measured = measured or [cache]
        self.may_change = may_change
        self.row = Row(name)

    def words(self):
        world = self.world
        kind = ["--user"] if self.kind == "user" else []
        return ["--rules-dir", world.tools / "rules" / self.kind, "--rules-dir", world.tools / "enabled" / self.kind,
                "--only", self.file, *kind]

    def as_owner(self, *words, **more):
        """The program runs as whose cache it is."""
        words = [str(word) for word in words]
        words = self.world.as_user(words) if self.kind == "user" else words
        return run(words, check=False, env={"PATH": self.world.environment["PATH"]}, cwd="/", **more)

    def program(self, *words):
        """What it printed: (bytes, or None where nobody can tell; what) of each line."""
        done = self.as_owner(self.world.programs / "spacekeep-command", *self.words(), *words)
        expect(done.returncode in (0, 1), f"spacekeep-command: {done.returncode} {done.stderr}")
        complaints = [line for line in done.stderr.splitlines() if not line.startswith(("would free", "freed"))]
        expect(not complaints, f"spacekeep-command said: {complaints}")
        lines = [line.split("\t", 1) for line in done.stdout.splitlines()]
        return [(None if amount == "?" else int(amount), what) for amount, what in lines]

    def dry_run(self, urgency):
        return self.program("--dry-run", "--urgency", urgency)

    def once(self, urgency):
        return self.program("--once", "--urgency", urgency, "--amount", EVERYTHING)

    def walk(self, expected, matters=lambda path: True):
        """From urgency to urgency: exactly the files in `expected` go, one set for each.

        `matters`: of which files that is looked at, where a tool keeps records of its own for each.
        """
        equal = unknown = grown = 0
        for urgency, wanted in zip("1234", expected):
            before, free_before = self.world.files(), self.world.free_bytes(self.volume())
            foretold = self.dry_run(urgency)
            expect(self.world.files() == before, f"the dry run at urgency {urgency} changed something")
            went = self.once(urgency)
            after = self.world.files()
            gone = set(filter(matters, before.keys() - after.keys()))
            expect(gone == set(wanted), f"urgency {urgency}: went though it should not: {sorted(gone - set(wanted))}; "
                                        f"stayed though it should not: {sorted(set(wanted) - gone)}")
            self.expect_rest_unchanged(before, after)
            claimed = sum(amount for amount, _ in went)
            accounts = self.grown_accounts(before, after)
            lost = occupied_bytes(before, *self.measured) - occupied_bytes(after, *self.measured)
            expect(claimed == lost, f"urgency {urgency}: claimed {claimed}, what went occupied {lost}")
            gained = self.world.free_bytes(self.volume()) - free_before
            expect(claimed <= gained <= claimed + 65536, f"claimed {claimed}, the volume gained {gained}")
            if any(amount is None for amount, _ in foretold):
                expect({what for _, what in went} <= {what for _, what in foretold}, f"foretold {foretold}, went {went}")
                unknown += 1
            else:
                expect([what for _, what in went] == [what for _, what in foretold] and
                       claimed == sum(amount for amount, _ in foretold) - accounts,
                       f"urgency {urgency}: foretold {foretold}, went {went}, the tool's account grew by {accounts}")
                equal += 1
                grown += accounts
            self.row.taken.append((claimed, len(gone)))
        expect(sum(amount for amount, _ in self.row.taken) > 0, "nothing was taken")
        self.row.dry_run = f"equal at {equal}" + (f", same command and unknown amount at {unknown}" if unknown else "") + (
            f", less {grown // 1024} KiB by which the tool's own account grew" if grown else "")

    def grown_accounts(self, before, after):
        """By how much the tool's own account, that it keeps beside what goes, grew meanwhile: nobody foretells that."""
        def size(files):
            return occupied_bytes({path: facts for path, facts in files.items() if self.may_change(path)}, *self.measured)
        return size(after) - size(before)

    def expect_rest_unchanged(self, before, after):
        changed = [path for path in before.keys() & after.keys() if before[path] != after[path]]
        changed += after.keys() - before.keys()
        changed = [path for path in changed if not self.may_change(path)]
        expect(not changed, f"changed: {changed}")

    def keeps_while(self, what, in_use, paths):
        """While `in_use` is entered all of `paths` stay, at each urgency; afterwards all of them go."""
        paths = [str(path) for path in paths]
        with in_use:
            before = {path: os.lstat(path).st_size for path in paths}
            for urgency in "1234":
                self.once(urgency)
                lost = [path for path in paths if not os.path.lexists(path)]
                expect(not lost, f"{what}: urgency {urgency} took {lost}")
            expect({path: os.lstat(path).st_size for path in paths} == before, f"{what}: something was cut short")
        age(paths, 400)  # having been used made them young
        self.once("4")
        left = [path for path in paths if os.path.lexists(path)]
        expect(paths and not left, f"{what}: afterwards {left} should have gone")
        self.row.in_use += ("; " if self.row.in_use else "") + what

    def check_service(self, in_use=True, item_bytes=None):
        """`in_use`: whether single files that are open stay. A tool's cache stays as a whole then."""
        done = self.as_owner(
            self.world.programs / "spacekeepctl", "check-service", "--volume", self.volume(), "--data", self.cache,
            *(["--in-use", self.cache] if in_use else []), *(["--item", item_bytes] if item_bytes else []), "--yes",
            "--", self.world.programs / "spacekeep-command", *self.words(), "--check-in")
        failed = [line for line in done.stdout.splitlines() if " FAILED" in line]
        expect(done.returncode == 0 and not failed, f"the service check: {done.stdout}{done.stderr}")
        self.row.checked = done.stdout.strip().splitlines()[-1].split(": ", 1)[1]

    def volume(self):
        folder = self.cache
        while not os.path.ismount(folder):
            folder = folder.parent
        return folder


def ages_for(days):
    """For each urgency an age at which it takes a file and a milder one does not, then one that none takes.

    `days`: what the rule says for urgencies 1 to 4. None where the urgency takes nothing that its milder one leaves.
    """
    ages = [None if i > 0 and days[i - 1] <= limit else limit + MARGIN / DAY for i, limit in enumerate(days)]
    return ages + [days[3] - MARGIN / DAY if days[3] > 0 else None]


def spread(units, days, young=True):
    """Ages the units (each a list of files) in turn; answers what should go at each urgency.

    `young`: some become so young that none should go.
    """
    ages = ages_for(days)[:5 if young else 4]
    usable = [i for i, days_old in enumerate(ages) if days_old is not None]
    expect(len(units) >= len(usable), f"only {len(units)} for {len(usable)} ages: {units}")
    expected = [set() for _ in ages]
    for number, unit in enumerate(units):
        bucket = usable[number % len(usable)]
        age(unit, ages[bucket])
        expected[bucket].update(map(str, unit))
    return expected[:4]


class Refill:
    """Makes the cache anew and old: first all of it goes, so that the tool has to write everything again."""

    def __init__(self, rule, fill, goes):
        self.rule, self.fill, self.goes = rule, fill, goes

    def __call__(self):
        self.fill()
        # Only the daily pass takes files without blocks.
        found = sorted(path for path, facts in self.rule.world.files(self.rule.cache).items()
                       if self.goes(path) and facts[2] > 0)
        expect(found, "the tool wrote nothing")
        age(found, 400)
        return found


def play_files(world, name, tool, cache, fill, goes, days, kept, busy=None, how="open", measured=None):
    """A rule of single files, from its first fill to its check.

    `goes`: whether a path below the cache is one of those that may go. `kept`: in words, what else was there.
    `busy`: (words, context) of the tool at work.
    """
    rule = Rule(world, name, cache, measured)
    rule.row.tool = tool
    refill = Refill(rule, fill, goes)
    found = refill()
    others = [path for path in world.files(cache) if path not in found]
    age(others, 400)
    rule.walk(spread([[path] for path in found], days))
    expect(all(map(os.path.exists, others)), "what the rule does not name went")
    young = [path for path in found if os.path.exists(path)]
    rule.row.kept = kept.format(others=len(others), young=len(young))
    found = refill()
    largest = max(found, key=os.path.getsize)
    user = rule.kind == "user"
    rule.keeps_while(f"file {how}", world.open_in_another_process(largest, user, how), [largest])
    if busy:
        found = refill()
        rule.keeps_while(busy[0], busy[1], found)
    refill()
    rule.check_service()
    return rule.row

