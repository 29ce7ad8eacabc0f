"""The test programs of a build directory, and a run of each that keeps its counts apart."""
import os
import pathlib
import shutil
import subprocess
import time

# The simulation of the whole system counts as a test, with this many seeds.
SIMULATED_SEEDS = 2000


def command_of(program, build):
    """The command that runs a test program whole; `program` is its path below `build`."""
    command = [str(build / program)]
    if pathlib.Path(program).name == 'spacekeep-sim':
        command += ['--seeds', str(SIMULATED_SEEDS), '--jobs', '1']
    return command


def programs_of(build):
    """Paths below `build`: cheap programs first, those that need Linux last."""
    kinds = ('test_simulated_', 'test_both_simulated_', 'test_both_threads_', 'test_linux_')
    found = sorted(path for path in (build / 'tests').glob('test_*') if path.is_file() and os.access(path, os.X_OK))
    ordered = [path for kind in kinds for path in found if path.name.startswith(kind)]
    simulation = build / 'sim' / 'spacekeep-sim'
    return [str(path.relative_to(build)) for path in ordered + [simulation] if path.exists()]


def run_counted(program, build, counts, kept):
    """Runs one program; its counts and those of the processes it starts end up in the folder `kept`.

    They count below `counts`, the folder that a daemon in a sandbox sees as well. Processes that lose the
    environment count in `counts` itself, so programs that start such are not to run side by side.
    Gives (exit status, seconds).
    """
    shutil.rmtree(kept, ignore_errors=True)
    kept.mkdir(parents=True)
    own = counts / kept.name
    own.mkdir(mode=0o1777, exist_ok=True)
    own.chmod(0o1777)
    began = time.monotonic()
    with open(kept / 'log', 'wb') as log:
        environment = dict(os.environ, LLVM_PROFILE_FILE=f'{own}/%m%c.profraw')
        status = subprocess.run(command_of(program, build), stdout=log, stderr=subprocess.STDOUT, cwd=build / 'tests',
                                env=environment, check=False).returncode
    return status, time.monotonic() - began


def collect(folder, kept, name):
    """Moves the counts out of memory into the folder of the program."""
    for number, path in enumerate(sorted(folder.glob('*.profraw'))):
        shutil.move(path, kept / f'{name}-{number}.profraw')
