#!/usr/bin/env -S python3 -EsB
"""What a start asks of the system, and what it leaves when a call fails or the power is cut."""

import collections
import os
import re

from device import (DATASETS, DEFAULT_ZONE, ICU, LATEST, LOCALTIME, MARKER, RECORD, SYSTEM, TZ,
                    ZONEINFO, compare, lay_out, lay_out_busy, main, run, snapshot, start)

STRACE = ['/strace', '-qq', '-o', '/trace']
ON_PATH = re.compile(r'\w*?(open|unlink|symlink|readlink|access|stat|rename|rmdir|mkdir|chmod)\w*'
                     r'\((?:AT_FDCWD, )?"(/[^"]*)"(?:, ([OF]_[A-Z_|]+))?')
FILES = {ZONEINFO: 'zoneinfo', ICU: 'icu', LOCALTIME: 'local', MARKER: 'marker', RECORD: 'record'}
READ_SYSTEM = f'open {SYSTEM}/+VERSION O_RDONLY, open /usr/share/icu/icutzformat.txt O_RDONLY,'
BEGIN = f'''open {TZ}/ O_RDONLY|O_CLOEXEC, protect 0x4, open {TZ}/tz/ O_RDONLY|O_CLOEXEC,
    protect 0x4, unlink {MARKER}, unlink /var/db/icu, {READ_SYSTEM} readlink {LATEST},
    readlink {ZONEINFO},'''


def trace():
    """Returns the calls of a start, from the first on the device on: the name of each, its number
    among those of the name, and its line."""
    calls, numbers = [], collections.Counter()
    with open('/trace') as lines:
        for line in lines:
            numbers[name := line.partition('(')[0]] += 1
            if calls or f'"{TZ}/"' in line:
                calls.append((name, numbers[name], line))
    return calls


def compare_calls(expected):
    """Compares calls on paths with their flags, protection classes, warnings and open files."""
    seen, files = [], 0
    for _, _, line in trace():
        files += 2 * line.startswith('pipe')  # of a sanitizer
        files += bool(re.match(r'open.* = \d', line)) - bool(re.match(r'close.* = 0', line))
        on_path = ON_PATH.match(line)
        if on_path and not ('stat' in on_path[1] and '/icutz/' in on_path[2]):  # as some walks do
            flags = (on_path[3] or '').replace('|O_LARGEFILE', '').partition('|O_NONBLOCK')[0]
            seen.append(f'{on_path[1]} {on_path[2]} {flags}'.strip())
        elif line.startswith('fcntl'):
            seen.append('protect ' + re.search(r' 0x40 .*(0x\d+)\)', line)[1])
        elif line.startswith('write(2, '):
            seen.append('warn' + f' with {files} files open' * bool(files))
    compare(re.split(r',\s+', expected), seen + [f'{files} files left open'] * bool(files))


def test_calls_of_a_start_with_nothing_to_do():
    lay_out()
    start(before=STRACE)
    compare_calls(f'{BEGIN} {READ_SYSTEM} readlink {LOCALTIME}')


def test_calls_of_a_busy_start():
    start(*lay_out_busy(), before=STRACE)
    old, new = f'{DATASETS}/2016e.1.0', f'{DATASETS}/2016g.1.0'
    compare_calls(f'''{BEGIN} open {old}/zoneinfo/+VERSION O_RDONLY, stat {old}/icutz,
        open {old}/icutz O_RDONLY, warn, {READ_SYSTEM} unlink {ZONEINFO}, symlink {SYSTEM},
        unlink {ICU}, open {MARKER} O_RDWR|O_CREAT, open {new}/zoneinfo/+VERSION O_RDONLY,
        stat {new}/icutz, open {new}/icutz O_RDONLY, unlink {ZONEINFO}, symlink {new}/zoneinfo,
        unlink {ICU}, symlink {new}/icutz, open {RECORD} O_WRONLY|O_CREAT|O_TRUNC,
        readlink {LOCALTIME}, warn, access {ZONEINFO}/No/Zone F_OK, warn, unlink {LOCALTIME},
        symlink {DEFAULT_ZONE[5:]}''')


def test_disturbed(current, latest, *losses):
    """Every call on a file fails once: the start goes on to its end and leaves usable links,
    and so does the next. And the power is cut before every call that changes a file: after one more
    start, some files are not what they are without the cut. The manual page has these losses, and
    no others, in CAVEATS.

    current    latest     losses, each behind the file that the call was for
    system     2016g.1.0  icu:icu icu:record record:record local:local
    2016f.1.1  2016g.1.0  zoneinfo:record icu:icu icu:record marker:record record:record local:local
    2016e.1.0  2016g.1.0  icu:icu icu:record record:record local:local
    2016e.1.0  none       icu:icu local:local
    system     none       local:local
    """
    def start_traced(*injection):
        lay_out(current, latest, '/usr/share/zoneinfo')
        return run(*STRACE, *injection)

    def unusable():
        return not os.path.isdir(ZONEINFO) or not os.readlink(LOCALTIME).startswith(ZONEINFO)

    def files():
        seen = snapshot()
        return {(name, seen.get(path, '').removesuffix(' *')) for path, name in FILES.items()}

    start_traced()
    calls, undisturbed, lost, path = trace(), files(), set(), None
    run()
    undisturbed |= files()
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
            lost |= {f'{FILES[path]}:{name}' for name, _ in files() - undisturbed}
    compare(sorted(losses), sorted(lost))


main('strace')
