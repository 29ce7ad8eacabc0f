"""What llvm-cov knows about a run, reduced to lines and branches per file."""
import json
import pathlib
import subprocess

FOLDERS = ('daemon', 'support', 'registry', 'client', 'operations', 'purge', 'purgeable',
           'history')


def merge(raw_files, into):
    """One profile from many raw ones."""
    names = into.with_suffix('.names')
    names.write_text('\n'.join(str(path) for path in raw_files), encoding='utf-8')
    subprocess.run(['llvm-profdata-16', 'merge', '--sparse', '-o', into, f'--input-files={names}'], check=True)


def _export(arguments, profile, objects):
    command = ['llvm-cov-16', 'export', *arguments, f'-instr-profile={profile}', str(objects[0])]
    command += [f'-object={path}' for path in objects[1:]]
    return subprocess.run(command, check=True, stdout=subprocess.PIPE, stderr=subprocess.DEVNULL).stdout


def summary_of(profile, objects, source):
    """{path below source: (lines, covered lines, branches, covered branches)}"""
    files = json.loads(_export(['-summary-only'], profile, objects))['data'][0]['files']
    result = {}
    for file in files:
        path = _below(file['filename'], source)
        if path is not None:
            lines, branches = file['summary']['lines'], file['summary']['branches']
            result[path] = (lines['count'], lines['covered'], branches['count'], branches['covered'])
    return result


def details_of(profile, objects, source):
    """{path below source: ({line: count}, [(line, taken, not taken) of each branch])}"""
    result, lines, branches = {}, {}, []
    for row in _export(['-format=lcov'], profile, objects).decode().splitlines():
        name, _, rest = row.partition(':')
        if name == 'SF':
            lines, branches = {}, []
            path = _below(rest, source)
            if path is not None:
                result[path] = (lines, branches)
        elif name == 'DA':
            line, count = rest.split(',')[:2]
            lines[int(line)] = int(count)
        elif name == 'BRDA':
            line, block, branch, count = rest.split(',')
            branches.append((int(line), int(block), int(branch), 0 if count == '-' else int(count)))
    return result


def _below(name, source):
    try:
        path = pathlib.Path(name).relative_to(source)
    except ValueError:
        return None
    return str(path) if path.parts[0] in FOLDERS else None
