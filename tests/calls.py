#!/usr/bin/env -S python3 -EsB
"""What a start asks of the system, and what is left when a call fails or the power is cut."""

import collections
import os
import re
import signal

from device import (DATASETS, DEFAULT_ZONE, ICU, LATEST, LOCALTIME, MARKER, RECORD, SYSTEM, TZ,
                    ZONEINFO, compare, lay_out, lay_out_busy, main, run, snapshot, start)

STRACE = ['/strace', '-qq', '-o', '/trace']
ON_PATH = re.compile(r'\w*?(open|unlink|symlink|readlink|access|stat|rename|rmdir|mkdir|chmod)\w*'
                     r'\((?:AT_FDCWD, )?"(/[^"]*)"(?:, ([OF]_[A-Z_|]+))?')


def trace():
    """Returns the calls of a traced start, from the first on the device: the name of each, its number
    among those of that name, and its line."""
    calls, numbers = [], collections.Counter()
    with open('/trace') as lines:
        for line in lines:
            name = line.partition('(')[0]
            numbers[name] += 1
            if calls or '"/var/db/timezone/"' in line:
                calls.append((name, numbers[name], line))
    return calls


def compare_calls(expected):
    """Compares calls on paths with their flags, protection classes, and the files open at warnings."""
    seen, files = [], 0
    for _, _, line in trace():
        files += bool(re.match(r'open.* = \d', line)) - bool(re.match(r'close.* = 0', line))
        if on_path := ON_PATH.match(line):
            flags = (on_path[3] or '').replace('|O_LARGEFILE', '').partition('|O_NONBLOCK')[0]
            seen.append(f'{on_path[1]} {on_path[2]} {flags}'.strip())
        elif line.startswith('fcntl'):
            seen.append('protect ' + re.search(r' 0x40 .*(0x\d+)\)', line)[1])
        elif line.startswith('write(2, '):
            seen.append(f'warn with {files} files open')
    compare(re.split(r',\s+', expected), [*seen, f'end with {files} files open'])


# What each start does first, and what the system dataset is read by.
SYSTEM_READ = f'open {SYSTEM}/+VERSION O_RDONLY, open /usr/share/icu/icutzformat.txt O_RDONLY, '
FIRST = f'''open {TZ}/ O_RDONLY|O_CLOEXEC, protect 0x4, open {TZ}/tz/ O_RDONLY|O_CLOEXEC, protect 0x4,
    unlink {MARKER}, unlink /var/db/icu, {SYSTEM_READ} readlink {LATEST}, readlink {ZONEINFO}, '''


def test_calls_of_a_start_with_nothing_to_do():
    lay_out()
    start(before=STRACE)
    compare_calls(f'{FIRST} {SYSTEM_READ} readlink {LOCALTIME}, end with 0 files open')


def test_calls_of_a_busy_start():
    start(*lay_out_busy(), before=STRACE)
    old, new = f'{DATASETS}/2016e.1.0', f'{DATASETS}/2016g.1.0'
    compare_calls(f'''{FIRST} open {old}/zoneinfo/+VERSION O_RDONLY, stat {old}/icutz,
        open {old}/icutz O_RDONLY, warn with 0 files open,
        {SYSTEM_READ} unlink {ZONEINFO}, symlink {SYSTEM}, unlink {ICU}, open {MARKER} O_RDWR|O_CREAT,
        open {new}/zoneinfo/+VERSION O_RDONLY, stat {new}/icutz, open {new}/icutz O_RDONLY,
        unlink {ZONEINFO}, symlink {new}/zoneinfo, unlink {ICU}, symlink {new}/icutz,
        open {RECORD} O_WRONLY|O_CREAT|O_TRUNC, readlink {LOCALTIME}, warn with 0 files open,
        access {ZONEINFO}/No/Zone F_OK, warn with 0 files open, unlink {LOCALTIME},
        symlink {DEFAULT_ZONE}, end with 0 files open''')


def test_marker_cannot_be_examined_or_closed():
    lay_out_busy()
    run(*STRACE)
    calls = trace()
    opened = [f'{MARKER}", O_' in line for _, _, line in calls].index(True)
    for name, number, _ in calls[opened + 1:opened + 3]:
        warnings, changes = lay_out_busy()
        warnings[1:1] = [f'Cannot touch file {MARKER}: Input/output error']
        start(warnings, changes, before=[*STRACE, f'-einject={name}:error=EIO:when={number}'])


def test_correction_cannot_be_linked():
    lay_out(localtime='/usr/share/zoneinfo/Asia/Tokyo')
    error = 'Input/output error'
    start([f'correcting={ZONEINFO}/Asia/Tokyo',
           f'create_symlink: from {LOCALTIME} to {ZONEINFO}/Asia/Tokyo: {error}', f'reset_zone: {error}'],
          {LOCALTIME: f'link {DEFAULT_ZONE}'}, before=[*STRACE, '-einject=/^symlink:error=EIO:when=1'])


def test_disturbed_start(current, latest, *lost):
    """Every call on a path fails once: the start ends by itself, with links that can be used. And the
    power is cut before each call that changes something: two more starts leave some files unlike
    those of starts without a cut. The manual page names these losses, and no others, in CAVEATS.

    current    latest     files, each behind that of the call which was not made
    system     2016g.1.0  icutz:icutz icutz:record record:record localtime:localtime
    2016f.1.1  2016g.1.0  zoneinfo:record icutz:icutz icutz:record marker:record record:record localtime:localtime
    2016e.1.0  2016g.1.0  icutz:icutz icutz:record record:record localtime:localtime
    2016e.1.0  none       icutz:icutz localtime:localtime
    system     none       localtime:localtime
    """
    names = {ZONEINFO: 'zoneinfo', ICU: 'icutz', LOCALTIME: 'localtime', MARKER: 'marker', RECORD: 'record'}

    def start_disturbed(*injection):
        lay_out(current, latest, '/usr/share/zoneinfo')
        return run(*STRACE, *injection)

    def files():
        seen = snapshot()
        return {(name, seen.get(path, '').removesuffix(' *')) for path, name in names.items()}

    start_disturbed()
    calls, undisturbed, differing = trace(), files(), set()
    run()
    undisturbed |= files()
    for name, number, line in calls:
        path = (re.findall(r'"(/[^"]*)"', line) or [path])[-1]
        if '"/' in line:
            process = start_disturbed(f'-einject={name}:error=EIO:when={number}')
            usable = os.path.isdir(ZONEINFO) and os.readlink(LOCALTIME).startswith(ZONEINFO)
            no_file = '(-1,' in ''.join(line for _, _, line in trace())
            no_data = b'locate' in process.stderr and 'icutz"' in line and 'link' not in name
            compare([line, '0 True False False'], [line, f'{process.returncode} {usable} {no_file} {no_data}'])
        if re.search('unlink|symlink|O_CREAT|write.*"20', line):
            compare([-9], [start_disturbed(f'-einject={name}:signal=KILL:when={number}').returncode])
            run()
            differing |= {f'{names[path]}:{name}' for name, _ in files() - undisturbed}
    compare(sorted(lost), sorted(differing))


main('strace')
