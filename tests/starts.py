#!/usr/bin/env -S python3 -EsB
"""What a start finds, and what it makes of that."""

import os
import resource

from device import (DATASETS, DEFAULT_ZONE, ICU, LATEST, LOCALTIME, MARKER, RECORD, SYSTEM,
                    SYSTEM_ICU, TZ, ZONEINFO, data_links, lay_out, lay_out_busy, main, put, rows,
                    start, switched)

WORDS = {'none': None, 'file': 'file', 'directory': 'directory', 'system': f'link {SYSTEM}'}


# Which dataset is current after a start, by the one that was and by the latest: by its version, or by
# the text of the link. The system has 2016f; updates of 2017 and 2018 have other ICU formats.
@rows('''
current         latest         then current  marker  record               warnings
system          none           system        none    -
system          2016g.1.0      2016g.1.0     none    2016f.1.0_2016g.1.0
system          2016f.1.1      2016f.1.1     none    2016f.1.0_2016f.1.1
system          2016f.1.0      system        none    -                    not_taken
system          2017a.1.0      system        none    -                    not_taken
system          2016g.1.0/     system        none    -                    unparsed not_taken
2016g.1.0       none           2016g.1.0     none    -
2016f.1.0       2016g.1.0      2016g.1.0     file    2016f.1.0_2016g.1.0
2016g.1.0       2016h.1.0      2016h.1.0     file    2016g.1.0_2016h.1.0
2016g.1.0       2016g.1.0      2016g.1.0     none    -                    not_taken
2016h.1.0       2016g.1.0      2016h.1.0     none    -                    not_taken
2016e.1.0       none           system        file    -                    incompatible
2017a.1.0       none           system        file    -                    incompatible
2018a.1.0       none           system        file    -                    incompatible
2016e.1.0       2016g.1.0      2016g.1.0     file    2016f.1.0_2016g.1.0  incompatible
2016d.1.0       2016e.1.0      2016e.1.0     file    2016f.1.0_2016e.1.0  incompatible
2017a.1.0       2016h.1.0      system        file    -                    incompatible not_taken
2147483648a     none           system        none    -                    no_data
2016g.1.0       2147483648a    system        none    -                    no_data
2016g.1.0       {LONG}cut      system        none    -                    bad_path={LONG} no_data
2016g.1.0       {TZ}/tz/       system        none    -                    bad_path no_data
2016g.1.0       {TZ}/tzx/1a    system        none    -                    bad_path no_data
2016g.1.0       {SYSTEM}       system        none    -                    bad_path no_data
2016g.1.0       tz/2016h.1.0   system        none    -                    bad_path no_data
2016e.1.0       /x{TZ}/tz/1a   system        file    -                    incompatible bad_path no_data
2016g.1.0       file           system        none    -                    unreadable no_data
file            none           system        none    -                    unreadable bad_links
{SYSTEM}/       none           system        none    -                    bad_link bad_links
tz/2016g.1.0/x  none           system        none    -                    bad_link bad_links
{TZ}/tz/        none           system        none    -                    bad_link bad_links
{TZ}/tz/1a      none           system        none    -                    bad_link bad_links
{TZ}/tz//x      none           system        none    -                    bad_link bad_links
{TZ}/tzx/1a/x   none           system        none    -                    bad_link bad_links
/x{TZ}/tz/1a/x  2016g.1.0      2016g.1.0     none    2016f.1.0_2016g.1.0  bad_link bad_links
{TZ}/tz/x/      none           system        file    -                    unparsed=x incompatible
{TZ}/tz/1a/b/c  none           system        file    -                    unparsed=1a/b incompatible
''')
def test_dataset(current, latest, then, marker, record, *warnings):
    update, new = (cell if cell[0].isdigit() else None for cell in (current, latest))
    lay_out(update or 'system', new, localtime='nowhere')
    before = {MARKER: 'directory', RECORD: 'file of an earlier switch', '/var/db/icu': 'directory'}
    if not update:
        before |= {ZONEINFO: WORDS.get(current, f'link {current}'), ICU: 'link stale'}
    if not new:
        before |= {LATEST: WORDS.get(latest, f'link {latest}')}
    for path, what in before.items():
        put(path, what)
    after = {LOCALTIME: f'link {DEFAULT_ZONE}', MARKER: WORDS[marker], '/var/db/icu': None}
    if current != then or {'bad_links', 'incompatible', 'no_data'}.intersection(warnings):
        after |= data_links(then)
    if record != '-':
        after |= {RECORD: f'file {record}'}
    arguments = {'bad_link': current, 'bad_path': latest, 'unparsed': latest,
                 'unreadable': LATEST if latest == 'file' else ZONEINFO}
    start([f'{word}={arguments[word]}' if word in arguments else word for word in warnings]
          + ['reset_zone'], after)



# What happens to a local-time link: "tried" is a correction that ends in the reset.
@rows('''
before                                  then
{ZONEINFO}/No/Zone                      kept
{ZONEINFO}                              kept
{ZONEINFO}X                             kept
/usr/share/zoneinfo/Asia/Tokyo          corrected
/usr/share/zoneinfo//Asia/Tokyo         corrected
/usr/share/zoneinfo                     corrected
/usr/share/zoneinfo/Asia/Tokyo/Zone     tried
/usr/share/zoneinfo.default/Asia/Tokyo  tried
/usr/share/zoneinf                      reset
/var/db/timezone/zoneinf                reset
/x{ZONEINFO}/Asia/Tokyo                 reset
/x/usr/share/zoneinfo/Asia/Tokyo        reset
../zoneinfo/Asia/Tokyo                  reset
none                                    reset
file                                    reset
directory                               reset
''')
def test_localtime(before, then):
    lay_out()
    put('/var/db/icu/entry', 'file')  # so that the directory stays
    put(LOCALTIME, WORDS.get(before, f'link {before}'))
    corrected = ZONEINFO + before.removeprefix('/usr/share/zoneinfo')
    after = {'kept': {}, 'corrected': {LOCALTIME: f'link {corrected}'}}
    start([f'unreadable={LOCALTIME}'] * (before in ('file', 'directory'))
          + [f'correcting={corrected}'] * (then in ('corrected', 'tried'))
          + ['reset_zone'] * (then in ('tried', 'reset')),
          after.get(then, {LOCALTIME: f'link {DEFAULT_ZONE}'}))


def test_local_time_is_corrected_through_the_new_dataset():
    lay_out(latest='2016g.1.0', localtime='/usr/share/zoneinfo/New/Zone')
    put(f'{DATASETS}/2016g.1.0/zoneinfo/New/Zone', 'file')
    start([f'correcting={ZONEINFO}/New/Zone'],
          {LOCALTIME: f'link {ZONEINFO}/New/Zone', **switched('2016f.1.0', '2016g.1.0')})


def test_order_of_versions():
    ranks = '''x | 0a | 2014a | 2014a.0 2014a.00 | 2014a.1 | 2014a.1.0 | 2014a.1.9 | 2014a.2 | 2014a.010
        02014a.10 | 2014aa | 2014az.7.1 | 2014b | 2014z.9.9 | 2015a | 10000a | 2147483647a.2147483647'''
    versions = [(rank, text) for rank, row in enumerate(ranks.split('|')) for text in row.split()]
    for old, current in versions:
        for new, latest in versions:
            lay_out(current, latest, system='')  # whose version is older than all
            refused = [f'unparsed={text}' for text in ('.1.0', current, latest) if text in '.1.0 x']
            if new > old:
                start(refused, switched(current, latest) | {MARKER: 'file'})
            else:
                start([*refused, 'not_taken'])


def test_versions_refused():
    for text in ('2014', 'a', 'a2014', '2014A', '2014aA', '2014a.', '2014a.b', '2014a.1b', '2014a.1.',
                 '2014a1', '2014a.1.0.2', '2014a..1', '2014a+1', '2014a.1+0', ' 2014a', '2014a ',
                 '2014a\n', '+2014a', '2014a.-1', '2014\udce9', '2014`', '2014{', '201/a', '201:a',
                 '2014a./', '2014a.1.:'):
        lay_out(latest=text)
        start([f'unparsed={text}', 'not_taken'])


def test_version_of_the_system():
    many = 10**5
    for what, word in (('file 2016f', '2016f'), ('file  \t\v\f\r\n2016f extra\n1a', '2016f'),
                       (f'file 2016{many * "f"}\v', f'2016{many * "f"}'),
                       (f'file {many * "0"}7a\f', f'{many * "0"}7a'),
                       (f'file {many * "A"}', many * 'A'), ('file A\udcff\0', 'A\udcff\0'),
                       ('file', ''), ('file  \n\t', ''), ('directory', ''), (None, '')):
        lay_out(latest='2999a')
        put(f'{SYSTEM}/+VERSION', what)
        text = f'{word}.1.0'.partition('\0')[0]
        start([f'unparsed={text}'] * (0 if word[:1].isdigit() else 2),
              switched('2016f.1.0', '2999a') | {RECORD: f'file {word}.1.0_2999a'})
    lay_out(system='2147483648a')
    start(['no_data'], status=1)


def test_icu_format():
    data = f'{DATASETS}/2016g.1.0/icutz'
    taken = switched('2016f.1.0', '2016g.1.0')

    def start_with(system, name, what='file', mode=None):
        lay_out(latest='2016g.1.0')
        put(f'{SYSTEM_ICU}/icutzformat.txt', system)
        put(f'{data}/icutz44l.dat')
        put(f'{data}/{name}', what)
        if mode:
            os.chmod(f'{data}/{name}', mode)

    for name in ('44L.dat', '44x.dat', 'l.dat', '44.dat', '44l.dat.bak', '44l.DAT', '44lxdat', '4ldat',
                 ':l.dat', '4\udcb2l.dat', '/l.dat', '/icutz44l.dat', '/../xicutz44l.dat', '-4l.dat'):
        start_with(None, f'icutz{name}')
        start((), taken)  # neither format is known, and so both are the same
    for what, mode in ('file', 0o770), ('link icutzformat.txt', None), ('directory', None):
        start_with(None, 'icutz44l.dat', what, mode)
        start((), taken)
    for text in '44l', '2015b', '0e', '9l':
        start_with(f'file \t{text}\nmore', f'icutz{text}.dat', mode=0o004)
        start((), taken)
    for system, name in ('file 4l', '44l'), ('file 44L', '44l'), ('file junk', '44x'), ('file', '44l'):
        start_with(system, f'icutz{name}.dat')
        start(['not_taken'])
    for text in '44l', '45b', '46e', '47l':
        put(f'{DATASETS}/icu/icutz{text}.dat', 'file')
    put(data, 'link ../icu')
    put(f'{SYSTEM_ICU}/icutzformat.txt', f'file {os.listdir(data)[0][5:8]}')
    start((), taken)


def test_first_start_of_a_system_without_data():
    lay_out()
    for path in '/usr/share', LOCALTIME, ZONEINFO:
        put(path)
    error = 'No such file or directory'
    start(['unparsed=.1.0', f'bad_link=: {error}', f'bad_links: {error}', 'unparsed=.1.0',
           'unparsed=.1.0', f'reset_zone: {error}'],
          {ZONEINFO: f'link {SYSTEM}', LOCALTIME: f'link {DEFAULT_ZONE}'})


def test_icu_link_cannot_be_made():
    lay_out(latest='2016g.1.0', localtime='nowhere')
    put(ICU, 'directory')
    kept = [f'remove: could not remove {ICU}: Is a directory',
            'unlink of ICU softlink failed: Is a directory']
    start([*kept, f'create_symlink: from {ICU} to {DATASETS}/2016g.1.0/icutz: File exists',
           'no_data: File exists', *kept, 'reset_zone'],
          {ZONEINFO: f'link {SYSTEM}', LOCALTIME: f'link {DEFAULT_ZONE}'})


def test_zoneinfo_link_cannot_be_made():
    lay_out()
    put(ZONEINFO, 'directory')
    kept = [f'remove: could not remove {ZONEINFO}: Is a directory',
            'Unlink of zoneinfo softlink failed: Is a directory',
            f'create_symlink: from {ZONEINFO} to {SYSTEM}: File exists']
    start([f'unreadable={ZONEINFO}', 'bad_links: Invalid argument', *kept, 'no_data: File exists',
           *kept], status=1)


def test_local_time_link_cannot_be_made():
    lay_out()
    put(LOCALTIME)
    put(f'{LOCALTIME}/entry', 'file')
    start([f'unreadable={LOCALTIME}', 'reset_zone: Invalid argument',
           f'create_symlink: from {LOCALTIME} to {DEFAULT_ZONE}: File exists'], status=1)


def test_directory_of_the_links_is_a_file():
    lay_out()
    put(TZ, 'file')
    error = 'Not a directory'
    start([f'read_symlink: {LATEST}: {error}', f'no_data: {error}',
           f'remove: could not remove {ZONEINFO}: {error}',
           f'Unlink of zoneinfo softlink failed: {error}',
           f'create_symlink: from {ZONEINFO} to {SYSTEM}: {error}'], status=1)


def test_permissions_are_left_to_the_mask():
    warnings, changes = lay_out_busy()
    modes = {path: changes[path].replace('file', '-rw-rw-rw-') for path in (MARKER, RECORD)}
    start(warnings, changes | modes, prepare=lambda: os.umask(0))


def break_standard_error():
    reader, writer = os.pipe()
    os.dup2(writer, 2)
    os.close(reader)


def test_standard_error_is_closed_or_broken():
    for prepare in lambda: os.close(2), break_standard_error:
        start((), lay_out_busy()[1], prepare=prepare)


def test_no_file_may_grow():
    warnings, changes = lay_out_busy()
    start(warnings, changes | {RECORD: 'file'},
          prepare=lambda: resource.setrlimit(resource.RLIMIT_FSIZE, (0, 0)))


def test_marker_and_record_cannot_be_written():
    warnings, changes = lay_out_busy()
    put(f'{MARKER}/entry', 'file')
    put(RECORD, 'directory')
    warnings[1:1] = [f'Cannot touch file {MARKER}: Is a directory']
    start(warnings, {path: changes[path] for path in (ZONEINFO, ICU, LOCALTIME)})


main()
