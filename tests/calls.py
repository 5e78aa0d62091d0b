#!/usr/bin/env -S python3 -EsB
"""What a start asks of the system, and what it leaves when a call fails or the power is cut."""

import itertools
import os
import pathlib
import re

from device import (DATASETS, DEFAULT_ZONE, ICU, LATEST, LOCALTIME, MARKER, RECORD, SYSTEM, TZ,
                    ZONEINFO, compare, lay_out, lay_out_busy, main, run, snapshot, start)

STRACE = ['/strace', '-qq', '-o', '/trace']
CALL = re.compile(
    r'^\w*?(open|unlink|symlink|readlink|access|rename|rmdir|mkdir|chmod)\w*\((?:AT_FDCWD, )?'
    r'"(/[^"]*)"(?:, ((?:\|?[OF]_(?!NONB)[A-Z]+)+))?|^(fcntl).*, (0x\d+)|^(write)\(2', re.MULTILINE)
FILES = {ZONEINFO: 'zoneinfo', ICU: 'icu', LOCALTIME: 'local', MARKER: 'marker', RECORD: 'record'}
READ_SYSTEM = f'open {SYSTEM}/+VERSION O_RDONLY, open /usr/share/icu/icutzformat.txt O_RDONLY,'
BEGIN = f'''open {TZ}/ O_RDONLY|O_CLOEXEC, fcntl 0x4, open {TZ}/tz/ O_RDONLY|O_CLOEXEC,
    fcntl 0x4, unlink {MARKER}, unlink /var/db/icu, {READ_SYSTEM} readlink {LATEST},
    readlink {ZONEINFO},'''


def trace():
    """Returns the calls of a start, from the first on the device on: the name of each, its number
    among those of the name, and its line."""
    lines = pathlib.Path('/trace').read_text().splitlines()
    names = [line.partition('(')[0] for line in lines]
    calls = [(name, names[:at + 1].count(name), lines[at]) for at, name in enumerate(names)]
    return [*itertools.dropwhile(lambda call: f'"{TZ}/"' not in call[2], calls)]


def compare_calls(expected):
    """Compares calls on paths with their flags, protection classes, warnings, and files closed."""
    text = '\n'.join(line for _, _, line in trace()).replace('|O_LARGEFILE', '')
    seen = [' '.join(filter(None, call)) for call in CALL.findall(text)]
    opened, closed, pipes = [len(re.findall(call, text, re.MULTILINE)) for call in (
        r'^open.* = \d', '^close.* = 0', '^pipe')]  # these, by which a sanitizer probes memory
    compare([*re.split(r',\s+', expected), f'{opened + 2 * pipes} files closed'],
            [*seen, f'{closed} files closed'])


def test_calls_of_a_start_with_nothing_to_do():
    lay_out()
    start(before=STRACE)
    compare_calls(f'{BEGIN} {READ_SYSTEM} readlink {LOCALTIME}')


def test_calls_of_a_busy_start():
    start(*lay_out_busy(), before=STRACE)
    old, new = f'{DATASETS}/2016e.1.0', f'{DATASETS}/2016g.1.0'
    compare_calls(f'''{BEGIN} open {old}/zoneinfo/+VERSION O_RDONLY, open {old}/icutz O_RDONLY,
        write, {READ_SYSTEM} unlink {ZONEINFO}, symlink {SYSTEM}, unlink {ICU},
        open {MARKER} O_RDWR|O_CREAT, open {new}/zoneinfo/+VERSION O_RDONLY,
        open {new}/icutz O_RDONLY, unlink {ZONEINFO}, symlink {new}/zoneinfo, unlink {ICU},
        symlink {new}/icutz, open {RECORD} O_WRONLY|O_CREAT|O_TRUNC, readlink {LOCALTIME}, write,
        access {ZONEINFO}/No/Zone F_OK, write, unlink {LOCALTIME}, symlink {DEFAULT_ZONE}''')


def test_disturbed(current, latest, *losses):
    """Every call on a file fails once: the start goes on to its end and leaves usable links,
    and so does the next. And the power is cut before every call that changes a file: after one more
    start, some files are not what they are without the cut, which the manual page has in CAVEATS.

    current    latest     losses, each behind the file that the call was for
    system     2016g.1.0  icu:icu icu:record local:local record:record
    2016f.1.1  2016g.1.0  icu:icu icu:record local:local marker:record record:record zoneinfo:record
    2016e.1.0  2016g.1.0  icu:icu icu:record local:local record:record
    2016e.1.0  none       icu:icu local:local
    """
    def start_traced(*injection):
        lay_out(current, latest, '/usr/share/zoneinfo')
        return run(*STRACE, *injection)

    def unusable():
        return not os.path.isdir(ZONEINFO) or not os.readlink(LOCALTIME).startswith(ZONEINFO)

    start_traced()
    calls, after, lost, path = trace(), snapshot(), set(), None
    run()
    after_next = snapshot()
    for name, number, line in calls:
        path = (re.findall(r'"(/[^"]*)"', line) or [path])[-1]
        if '"/' in line or path == MARKER and re.search('stat|close', name):
            process = start_traced(f'-einject={name}:error=EIO:when={number}')
            faults = {'ends too early': process.returncode, 'unusable links': unusable(),
                      'not mended by the next start': run().returncode or unusable(),
                      'a call on no file': any('(-1,' in line for _, _, line in trace()),
                      'no format': path.endswith('.0/icutz') and b'locate' in process.stderr,
                      'marker': (path == MARKER and 'unlink' not in name)
                      != (b'touch' in process.stderr)}
            compare([], [f'{fault}: {line}' for fault, found in faults.items() if found])
        if re.search('unlink|symlink|O_CREAT|write.*"20', line):
            compare([-9], [start_traced(f'-einject={name}:signal=KILL:when={number}').returncode])
            run()
            seen = snapshot()
            lost |= {f'{FILES[path]}:{FILES[file]}' for file in after.keys() | seen.keys()
                     if seen.get(file) not in (after.get(file), after_next.get(file))}
    compare([*losses], sorted(lost))


main('strace')
