"""Compiles a changed file and links programs with it, beside a finished build that stays as it is."""
import concurrent.futures
import json
import os
import pathlib
import re
import shlex
import subprocess

COMPILE_LIMIT_SECONDS = 600


class Build:
    """A finished Ninja build. Use from one thread."""

    def __init__(self, directory):
        self.directory = pathlib.Path(directory)
        entries = json.loads((self.directory / 'compile_commands.json').read_text(encoding='utf-8'))
        self._compile_commands = {_output(entry['command']): entry for entry in entries}
        self._dependents = _dependents(_ninja(self.directory, '-t', 'deps'))
        self._archives = _archives((self.directory / 'build.ninja').read_text(encoding='utf-8'))
        self._link_commands = {}

    def objects_with(self, file):
        """The objects that are made from `file` (an absolute path) or from something that includes it."""
        return sorted(self._dependents.get(str(file), ()))

    def link_command(self, program):
        if program not in self._link_commands:
            last = _ninja(self.directory, '-t', 'commands', program).strip().splitlines()[-1]
            self._link_commands[program] = last
        return self._link_commands[program]

    def objects_of(self, program, objects):
        """Those of `objects` that go into the program, by name or from an archive."""
        words = set(shlex.split(self.link_command(program)))
        linked = set(words)
        for word in words:
            linked.update(self._archives.get(word, ()))
        return [name for name in objects if name in linked]

    def compile(self, objects, where):
        """Compiles each object anew below `where`. Gives None, or what the compiler said."""
        def one(name):
            entry = self._compile_commands[name]
            target = pathlib.Path(where, name)
            target.parent.mkdir(parents=True, exist_ok=True)
            command = _with_output(entry['command'], name, str(target))
            return _run(command + ' -w', entry['directory'])

        with concurrent.futures.ThreadPoolExecutor(max_workers=os.cpu_count()) as pool:
            return next((said for said in pool.map(one, objects) if said is not None), None)

    def link(self, program, objects, where):
        """Links the program in its place with the objects below `where` instead of its own.

        What compiles has the names that it had, so it links; if not, something is wrong here.
        """
        command = _with_output(self.link_command(program), program, program + '.mutant')
        replaced = {name: str(pathlib.Path(where, name)) for name in objects}
        for archive, members in self._archives.items():
            if not replaced.keys().isdisjoint(members):
                replaced[archive] = str(self._archive_with(archive, replaced, where))
        for name, mine in replaced.items():
            command = re.sub(r'(?<=\s)' + re.escape(name) + r'(?=\s)', lambda _, mine=mine: mine, command)
        said = _run(command, self.directory)
        if said is not None:
            raise RuntimeError(f'{program} does not link: {said}')
        os.replace(self.directory / program, self.directory / (program + '.whole'))
        os.replace(self.directory / (program + '.mutant'), self.directory / program)

    def _archive_with(self, archive, replaced, where):
        """The archive below `where`, made of the changed objects and of the others as they are."""
        mine = pathlib.Path(where, archive).resolve()
        if not mine.exists():
            mine.parent.mkdir(parents=True, exist_ok=True)
            members = [replaced.get(name, self.directory / name) for name in self._archives[archive]]
            subprocess.run(['ar', 'qcsT', mine, *members], cwd=self.directory, check=True)
        return mine

    def restore(self, program):
        whole = self.directory / (program + '.whole')
        if whole.exists():
            os.replace(whole, self.directory / program)

    def restore_all(self):
        """Also what a killed run has left."""
        for whole in self.directory.glob('*/*.whole'):
            os.replace(whole, whole.with_suffix(''))


def _ninja(directory, *arguments):
    return subprocess.run(['ninja', '-C', str(directory), '--quiet', *arguments], check=True, text=True,
                          stdout=subprocess.PIPE).stdout


def _run(command, directory):
    done = subprocess.run(command, shell=True, cwd=directory, stdout=subprocess.PIPE, stderr=subprocess.STDOUT,
                          text=True, errors='replace', timeout=COMPILE_LIMIT_SECONDS, check=False)
    return None if done.returncode == 0 else done.stdout


def _output(command):
    words = shlex.split(command)
    return words[words.index('-o') + 1]


def _with_output(command, old, new):
    changed, count = re.subn(r'-o ' + re.escape(old) + r'(?=\s|$)', lambda _: '-o ' + shlex.quote(new), command)
    if count != 1:
        raise ValueError(f'cannot tell where this command writes {old}: {command}')
    return changed


def _dependents(text):
    """{file: {objects}} from what ninja says about dependencies."""
    result, current = {}, None
    for row in text.splitlines():
        if row and not row[0].isspace():
            current = row.split(':')[0]
        elif row.strip() and current and current.endswith('.o'):
            result.setdefault(row.strip(), set()).add(current)
    return result


def _archives(text):
    """{archive: [objects]} from build.ninja."""
    result = {}
    for match in re.finditer(r'^build (\S+\.a): \S+ ([^|\n]*)', text, re.MULTILINE):
        result[match.group(1)] = [word for word in match.group(2).split() if word.endswith('.o')]
    return result
