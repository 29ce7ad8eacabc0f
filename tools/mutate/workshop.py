"""A copy of the sources and of a finished build, in a private mount namespace at the paths of the originals.

Ninja and the programs know absolute paths; where the copy stands at the same ones nothing has to be
built anew, and what a mutant breaks stays in here. Needs root, as the tests on Linux do.
"""
import os
import pathlib
import shutil
import subprocess
import sys

_INSIDE = 'SPACEKEEP_MUTATE_INSIDE'


def enter():
    """Starts this program again in a mount namespace of its own, once."""
    if os.environ.get(_INSIDE):
        return
    if os.geteuid() != 0:
        sys.exit('mutate: needs root, for a private mount namespace and for the tests on Linux. Try: sudo ./dev mutate')
    os.environ[_INSIDE] = '1'
    os.execvp('unshare', ['unshare', '--mount', '--propagation', 'private', sys.executable, *sys.argv])


def fill(workshop, source, build):
    """Copies what git knows of `source` and all of `build`, unless the copy is there already."""
    if (workshop / 'filled').exists():
        return
    shutil.rmtree(workshop / 'tree', ignore_errors=True)
    shutil.rmtree(workshop / 'build', ignore_errors=True)
    (workshop / 'tree').mkdir(parents=True)
    names = subprocess.run(['git', '-C', str(source), 'ls-files', '-z', '--cached', '--others', '--exclude-standard'], check=True,
                           stdout=subprocess.PIPE).stdout
    # A file that is gone is no reason to stop: somebody may be working on the original.
    subprocess.run(['tar', '-C', str(source), '--null', '-T', '-', '--ignore-failed-read', '-cf', workshop / 'tree.tar'],
                   input=names, check=False)
    subprocess.run(['tar', '-C', str(workshop / 'tree'), '-xpf', workshop / 'tree.tar'], check=True)
    (workshop / 'tree.tar').unlink()
    subprocess.run(['cp', '-a', str(build), workshop / 'build'], check=True)
    (workshop / 'filled').touch()


def mount(workshop, source, build, counts):
    """Puts the copies in the place of the originals, for this process and those it starts."""
    mine = workshop / 'counts'
    mine.mkdir(exist_ok=True)
    mine.chmod(0o1777)
    counts.mkdir(mode=0o1777, exist_ok=True)
    _bind(mine, counts)
    if source in build.parents:
        (workshop / 'tree' / build.relative_to(source)).mkdir(parents=True, exist_ok=True)
    copy = os.open(workshop / 'build', os.O_PATH)
    _bind(workshop / 'tree', source)
    _bind(pathlib.Path(f'/proc/{os.getpid()}/fd/{copy}'), build)
    os.chdir('/')


def forget_counts(counts):
    for path in pathlib.Path(counts).glob('*.profraw'):
        path.unlink()


def _bind(what, where):
    subprocess.run(['mount', '--bind', str(what), str(where)], check=True)
