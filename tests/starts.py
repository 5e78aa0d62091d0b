#!/usr/bin/env -S python3 -EsB
"""What a start does, and what a disturbed one leaves. Usage: starts.py PROGRAM [WORD...]"""

import os
import re
import resource

from device import (DATASETS, DEFAULT_ZONE, ICU, LATEST, LOCALTIME, MARKER, RECORD, RESET_ZONE,
                    SYSTEM, SYSTEM_ICU, TZ, TREE, ZONEINFO, compare, data_links, lay_out,
                    lay_out_busy, main, put, run, snapshot, start)

STRACE = ['/strace', '-qq', '-E', 'ASAN_OPTIONS=detect_leaks=0', '-o', '/trace']
CALL = re.compile(
    r'(?m)^\w*?(open|unlink|symlink|readlink|access)\w*\((?:AT_FDCWD, )?"(/[^"]*)"'
    r'(?:, ((?:\|?[OF]_(?!NONB)[A-Z]+)+))?|^(fcntl).* 0x40.*, (0x\d+)|^(write)\(2|^(\w*sync)\(')
READ_SYSTEM = f'open {SYSTEM}/+VERSION O_RDONLY, open /usr/share/icu/icutzformat.txt O_RDONLY,'
FIRST_CALLS = f'''open {TZ}/ O_RDONLY|O_CLOEXEC, fcntl 0x4, open {TZ}/tz/ O_RDONLY|O_CLOEXEC,
    fcntl 0x4, unlink {MARKER}, unlink /var/db/icu, {READ_SYSTEM} readlink {LATEST},
    readlink {ZONEINFO},'''


def test_dataset(current, latest, then, marker, record, *warnings):
    """The dataset current after a start, by the one before and the latest; the system has 2016f.

    current        latest       then      marker record              warnings
    system         2016g.1.0    2016g.1.0 none   2016f.1.0_2016g.1.0
    system         2016f.1.0    system    none   -                   not_taken
    system         2017a.1.0    system    none   -                   not_taken # other ICU data
    2016g.1.0      none         2016g.1.0 none   -
    2016f.1.0      2016g.1.0    2016g.1.0 file   2016f.1.0_2016g.1.0
    2016e.1.0      none         system    file   -                   incompatible
    2016e.1.0      2016g.1.0    2016g.1.0 file   2016f.1.0_2016g.1.0 incompatible
    2016d.1.0      2016e.1.0    2016e.1.0 file   2016f.1.0_2016e.1.0 incompatible
    2017a.1.0      2016h.1.0    system    file   -                   incompatible not_taken
    2017a.1.0      2017b.1.0    system    file   -                   incompatible not_taken
    2147483648a    none         system    none   -                   no_data
    2016g.1.0      2147483648a  system    none   -                   no_data
    2016e.1.0      /            system    file   -                   incompatible bad_path=/ no_data
    2016g.1.0      file         system    none   -                   no_link={LATEST} no_data
    file           none         system    none   -                   no_link={ZONEINFO} bad_links
    none           none         system    none   -                   bad_link= bad_links
    /x             2016g.1.0    2016g.1.0 none   2016f.1.0_2016g.1.0 bad_link=/x bad_links
    {TZ}/tz/x/     none         system    file   -                   unparsed=x incompatible
    {TZ}/tz/1a//b  none         system    file   -                   unparsed=1a/ incompatible
    {TZ}/tz/1a/b/c none         system    file   -                   unparsed=1a/b incompatible
    """
    lay_out(current, latest, './nowhere', {
        MARKER: 'directory', RECORD: 'file of an earlier switch', '/var/db/icu': 'directory'})
    changes = RESET_ZONE | {MARKER: None if marker == 'none' else 'file', '/var/db/icu': None}
    changes |= data_links(then) if then != current else {}
    changes |= {RECORD: f'file {record}'} if record != '-' else {}
    start([*warnings, 'reset_zone'], changes)


def test_link_names_no_dataset():
    for text in f'{SYSTEM}/ {TREE} {TZ}/tz/1 {TZ}/tz//x {TZ}/tzx/1/x tz/1a/x /x{TZ}/tz/1/x'.split():
        lay_out(text)
        start([f'bad_link={text}', 'bad_links'], data_links('system'))
    for text in f'{TZ}/tz/', f'{TZ}/tzx/1a', 'tz/1a', SYSTEM, f'/x{TZ}/tz/1a', f'/{2000 * "x"}':
        lay_out('2016g.1.0', text)
        start([f'bad_path={text[:1024]}', 'no_data'], data_links('system'))


def test_local_time(then, warnings, link, *links):
    """What a start makes of a local-time link, by its text.

    then      warnings              links
    kept      -                     {ZONEINFO}/No/Zone {ZONEINFO} {ZONEINFO}X {ZONEINFO}/../x
    corrected correcting            {TREE}/Asia/Tokyo {TREE}//Asia/Tokyo {TREE}/New {TREE}/ {TREE}
    reset     correcting,reset_zone {TREE}.default/New {TREE}/posix/New {TREE}/New/ {TREE}/Gone
    reset     reset_zone            none zoneinfo/Asia/Tokyo ../zoneinfo/Asia/Tokyo {TZ}/zoneinf
    reset     reset_zone            /usr/share/zoneinfX/New /x{TREE}/Asia/Tokyo /x{ZONEINFO}/x
    reset     reset_zone            {DATASETS}/2016g.1.0/zoneinfo/Asia/Tokyo /..{SYSTEM}/Asia/Tokyo
    reset     no_link={LOCALTIME},reset_zone directory
    """
    tree = f'{DATASETS}/2016g.1.0/zoneinfo'
    zones = {f'{tree}/Asia/Tokyo': 'file', f'{tree}/New': 'file', f'{tree}/Gone': 'link nowhere'}
    for link in (link, *links):
        lay_out('system', '2016g.1.0', link, zones | {'/var/db/icu/entry': 'file'})
        corrected = link.replace(TREE, ZONEINFO, 1)
        changes = {'kept': {}, 'corrected': {LOCALTIME: f'link {corrected}'}, 'reset': RESET_ZONE}
        start([word.replace('correcting', f'correcting={corrected}') for word in warnings.split(',')
               if word != '-'], data_links('2016g.1.0', '2016f.1.0') | changes[then])


def test_order_of_versions():
    ranks = '''x | 0a | 2014a | 2014a.0 2014a.00 | 2014a.1 | 2014a.1.0 | 2014a.1.9 | 2014a.9 |
        2014a.010 02014a.10 | 2014aa | 2014az.7 | 2014b | 2014z.9 | 2015a | 10000a | 2147483647a'''
    versions = [(rank, text) for rank, row in enumerate(ranks.split('|')) for text in row.split()]
    for (old, current), (new, latest) in [(a, b) for a in versions for b in versions]:
        lay_out(current, latest, besides={f'{SYSTEM}/+VERSION': None})  # older than all
        refused = [f'unparsed={text}' for text in ('.1.0', current, latest) if text in '.1.0 x']
        changes = data_links(latest, current) | {MARKER: 'file'} if new > old else {}
        start(refused + ['not_taken'] * (not changes), changes)


def test_version_refused():
    texts = """2014 a a2014 2014A 2014aA 2014a. 2014a.b 2014a.1b 2014a.1. 2014a1 2014a.1.0.2 2014a+1
        2014a.1+0 +2014a 2014a.-1 2014` 2014{ 201/a 201:a 2014a./ 2014a.1.: 2014a/ 1a/zoneinfo"""
    for text in [*texts.split(), ' 2014a', '2014a ', '2014a\n', '2014\udce9', '2014a..1']:
        lay_out(latest=text)
        start([f'unparsed={text}', 'not_taken'])


def test_version_of_the_system():
    for what in ('file 2016f', 'file  \t\v\f\r\n2016f extra\n1a', f'file 2016{10**5 * "f"}\v',
                 f'file {10**5 * "0"}7a\f', f'file {10**5 * "A"}', 'file A.2\udcff', 'file  \n\t',
                 'directory', None):
        lay_out(latest='2999a', besides={f'{SYSTEM}/+VERSION': what})
        word = ''.join((what or '').split()[1:2])
        start([f'unparsed={word}.1.0'] * (0 if word[:1].isdigit() else 2),
              data_links('2999a', f'{word}.1.0'))
    lay_out(besides={f'{SYSTEM}/+VERSION': 'file 2147483648a'})
    start(['no_data'], status=1)


def test_icu_format():
    data, taken = f'{DATASETS}/2016g.1.0/icutz', data_links('2016g.1.0', '2016f.1.0')
    names = """44L.dat 44x.dat l.dat 44.dat 44l.dat.bak 44l.DAT 44lxdat 4ldat :l.dat 4\udcb2l.dat
        -4l.dat /l.dat /icutz44l.dat /../xicutz44l.dat"""  # none has a format
    cases = [(None, name, 'file', 0o644) for name in names.split()] + [
        (None, '44l.dat', 'file', 0o773), (None, '44l.dat', 'link icutzformat.txt', 0o644),
        (None, '44l.dat', 'directory', 0o755), ('junk', '44x.dat', 'file', 4),
        *((text, f'{text}.dat', 'file', 4) for text in ('44l', '044l', '9e', 17 * '2' + 'b')),
        *((text, '44l.dat', 'file', 4) for text in ('', '44lx', '44L', '4l', '44'))]
    for system, name, what, mode in cases:
        lay_out(latest='2016g.1.0', besides={
            f'{SYSTEM_ICU}/icutzformat.txt': system and f'file \t{system}\nmore',
            f'{data}/icutz44l.dat': None, f'{data}/icutz{name}': what})
        os.chmod(f'{data}/icutz{name}', mode)
        same = system in (None, name[:-4])
        start([] if same else ['not_taken'], taken if same else {})
    put({f'{DATASETS}/icu/icutz{text}.dat': 'file' for text in ('46e', '44l', '47l', '45b')}
        | {data: 'link ../icu'})
    put({f'{SYSTEM_ICU}/icutzformat.txt': f'file {os.listdir(data)[0][5:8]}'})  # that of the first
    start((), taken)


def test_link_cannot_be_made():
    lay_out('system', '2016g.1.0', './nowhere', {ICU: 'directory'})
    icu = [f'remove: could not remove {ICU}: Is a directory',
           'unlink of ICU softlink failed: Is a directory']
    start([*icu, f'create_symlink: from {ICU} to {DATASETS}/2016g.1.0/icutz: File exists',
           'no_data: File exists', *icu, 'reset_zone'], {ZONEINFO: f'link {SYSTEM}'} | RESET_ZONE)
    lay_out('directory')
    zoneinfo = [f'remove: could not remove {ZONEINFO}: Is a directory',
                'Unlink of zoneinfo softlink failed: Is a directory',
                f'create_symlink: from {ZONEINFO} to {SYSTEM}: File exists']
    start([f'no_link={ZONEINFO}', 'bad_links: Invalid argument', *zoneinfo, 'no_data: File exists',
           *zoneinfo], status=1)
    lay_out(localtime='directory', besides={f'{LOCALTIME}/entry': 'file', DATASETS: None})
    start([f'no_link={LOCALTIME}', 'reset_zone: Invalid argument',
           f'create_symlink: from {LOCALTIME} to {DEFAULT_ZONE}: File exists'], status=1)
    lay_out(besides={TZ: 'file'})
    texts = ['read_symlink: ' + LATEST, 'no_data', *(text.rpartition(': ')[0] for text in zoneinfo)]
    start([f'{text}: Not a directory' for text in texts], status=1)


def test_odd_surroundings():
    for prepare in lambda: os.close(2), lambda: os.dup2(os.pipe()[1], 2):  # whose reader ends
        start((), lay_out_busy()[1], prepare=prepare)
    warnings, changes = lay_out_busy()
    start(warnings, {path: what.replace('file', '-rw-rw-rw-') for path, what in changes.items()},
          prepare=lambda: os.umask(0))
    lay_out_busy()
    put({f'{MARKER}/entry': 'file'})
    warnings[1:1] = [f'Cannot touch file {MARKER}: Is a directory']
    del changes[MARKER]
    start(warnings, changes | {RECORD: 'file'},
          prepare=lambda: resource.setrlimit(resource.RLIMIT_FSIZE, (0, 0)))


def trace():
    """Returns each call on the device: its name, its number among those of the name, its line."""
    lines = open('/trace').read().splitlines()
    names = [line.partition('(')[0] for line in lines]
    calls = [(name, names[:at + 1].count(name), lines[at]) for at, name in enumerate(names)]
    return calls[[f'"{TZ}/"' in line for line in lines].index(True):]


def compare_calls(expected):
    """Compares calls on paths with their flags, protection classes, warnings, and files closed."""
    text = '\n'.join(line for _, _, line in trace()).replace('|O_LARGEFILE', '')
    seen = [' '.join(filter(None, call)) for call in CALL.findall(text)]
    opened, closed, pipes = [len(re.findall(call, text, re.MULTILINE)) for call in (
        r'^open.* = \d', '^close.* = 0', '^pipe')]  # by which a sanitizer probes memory
    compare([*re.split(r',\s+', expected), f'{opened + 2 * pipes} files closed'],
            [*seen, f'{closed} files closed'])


def test_traced_calls():
    lay_out()
    start(before=STRACE)
    compare_calls(f'{FIRST_CALLS} {READ_SYSTEM} readlink {LOCALTIME}')
    start(*lay_out_busy(), before=STRACE)
    old, new = f'{DATASETS}/2016e.1.0', f'{DATASETS}/2016g.1.0'
    compare_calls(f'''{FIRST_CALLS} open {old}/zoneinfo/+VERSION O_RDONLY,
        open {old}/icutz O_RDONLY, write, {READ_SYSTEM} unlink {ZONEINFO}, symlink {SYSTEM},
        unlink {ICU}, open {MARKER} O_RDWR|O_CREAT, open {new}/zoneinfo/+VERSION O_RDONLY,
        open {new}/icutz O_RDONLY, unlink {ZONEINFO}, symlink {new}/zoneinfo, unlink {ICU},
        symlink {new}/icutz, open {RECORD} O_WRONLY|O_CREAT|O_TRUNC, readlink {LOCALTIME}, write,
        access {ZONEINFO}/No/Zone F_OK, write, unlink {LOCALTIME}, symlink {DEFAULT_ZONE}''')


def test_traced_and_disturbed(current, latest, *losses):
    """A call fails, or the power is cut before a change: the manual's CAVEATS list what is lost.

    current    latest     losses: the file of the call and the file lost, by first letters
    2016f.1.1  2016g.1.0  TZV:TZV icu:TZV icu:icu icu:nee loc:loc nee:TZV nee:nee zon:TZV zon:nee
    2016e.1.0  none       icu:icu icu:nee loc:loc nee:nee zon:nee
    """
    def start_traced(*injection):
        lay_out(current, latest, '/usr/share/zoneinfo')
        return run(*STRACE, *injection)

    def usable(process):
        links = os.path.isdir(ZONEINFO) and os.readlink(LOCALTIME).startswith(ZONEINFO)
        return links and process.returncode == 0

    start_traced()
    calls, after, lost, path = trace(), snapshot(), set(), None
    for name, number, line in calls:
        path = (re.findall(r'"(/[^"]*)"', line) or [path])[-1]
        if '"/' in line or path == MARKER and re.search('stat|close', name):
            process = start_traced(f'-einject={name}:error=EIO:when={number}')
            warned = (b'touch' in process.stderr) == (path == MARKER and 'unlink' not in name)
            facts = f'usable {usable(process)}, warned {warned}, usable again {usable(run())}'
            compare(['usable True, warned True, usable again True', line], [facts, line])
        if re.search('unlink|symlink|O_CREAT|write.*"20', line):
            start_traced(f'-einject={name}:signal=KILL:when={number}')
            marker = {MARKER: after.get(MARKER)} if MARKER in snapshot() else {}
            run()
            seen = snapshot() | marker
            lost |= {f'{os.path.basename(path)[:3]}:{os.path.basename(file)[:3]}'
                     for file in after.keys() | seen.keys() if seen.get(file) != after.get(file)}
    compare([*losses], sorted(lost))


main('strace')
