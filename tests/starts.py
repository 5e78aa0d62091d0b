#!/usr/bin/env -S python3 -EsB
"""What a start finds, and what it makes of that."""

import os
import resource

from device import (DATASETS, DEFAULT_ZONE, ICU, LATEST, LOCALTIME, MARKER, RECORD, SYSTEM,
                    SYSTEM_ICU, TZ, WORDS, ZONEINFO, data_links, lay_out, lay_out_busy, main, put,
                    start, switched)


def test_dataset(current, latest, then, marker, record, *warnings):
    """Which dataset is current after a start, by the one that was and by the latest: that of the
    system, which has 2016f, an update of a version, or what another text of the link names.

    current         latest         then current  marker  record               warnings
    system          none           system        none    -
    system          2016g.1.0      2016g.1.0     none    2016f.1.0_2016g.1.0
    system          2016f.1.1      2016f.1.1     none    2016f.1.0_2016f.1.1
    system          2016f.1.0      system        none    -                    not_taken
    system          2017a.1.0      system        none    -                    not_taken  # other ICU data
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
    2016g.1.0       ../2016h.1.0   system        none    -                    bad_path no_data
    2016e.1.0       /x{TZ}/tz/1a   system        file    -                    incompatible bad_path no_data
    2016g.1.0       file           system        none    -                    unreadable={LATEST} no_data
    file            none           system        none    -                    unreadable={ZONEINFO} bad_links
    none            none           system        none    -                    bad_link= bad_links
    {SYSTEM}/       none           system        none    -                    bad_link bad_links
    ../2016g.1.0/x  none           system        none    -                    bad_link bad_links
    {TZ}/tz/        none           system        none    -                    bad_link bad_links
    {TZ}/tz/1a      none           system        none    -                    bad_link bad_links
    {TZ}/tz//x      none           system        none    -                    bad_link bad_links
    {TZ}/tzx/1a/x   none           system        none    -                    bad_link bad_links
    /x{TZ}/tz/1a/x  2016g.1.0      2016g.1.0     none    2016f.1.0_2016g.1.0  bad_link bad_links
    {TZ}/tz/x/      none           system        file    -                    unparsed=x incompatible
    {TZ}/tz/1a/b/c  none           system        file    -                    unparsed=1a/b incompatible
    """
    lay_out(current, latest, './nowhere')
    put(MARKER, 'directory')
    put(RECORD, 'file of an earlier switch')
    put('/var/db/icu', 'directory')
    changes = {LOCALTIME: f'link {DEFAULT_ZONE}', MARKER: WORDS[marker], '/var/db/icu': None}
    if current != then or {'bad_links', 'incompatible', 'no_data'}.intersection(warnings):
        changes |= data_links(then)
    if record != '-':
        changes[RECORD] = f'file {record}'
    texts = {'bad_link': current, 'bad_path': latest, 'unparsed': latest}
    start([f'{word}={texts[word]}' if word in texts else word for word in warnings] + ['reset_zone'],
          changes)


def test_local_time(link, then):
    """What happens to the local-time link; "tried" is a correction that ends in the reset.

    link                                    then
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
    """
    lay_out(localtime=link)
    put('/var/db/icu/entry', 'file')  # so the directory stays
    corrected = link.replace('/usr/share/zoneinfo', ZONEINFO, 1)
    text = {'kept': link, 'corrected': corrected}.get(then, DEFAULT_ZONE)
    start([f'unreadable={LOCALTIME}'] * (link in ('file', 'directory'))
          + [f'correcting={corrected}'] * (then in ('corrected', 'tried'))
          + ['reset_zone'] * (then in ('tried', 'reset')),
          {} if then == 'kept' else {LOCALTIME: f'link {text}'})


def test_local_time_is_corrected_by_the_dataset_that_is_now_current():
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
            warnings = [f'unparsed={text}' for text in ('.1.0', current, latest) if text in '.1.0 x']
            changes = switched(current, latest) | {MARKER: 'file'} if new > old else {}
            start(warnings + ['not_taken'] * (not changes), changes)


def test_version_refused():
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
                       (f'file {many * "0"}7a\f', f'{many * "0"}7a'), (f'file {many * "A"}', many * 'A'),
                       ('file A\udcff', 'A\udcff'), ('file  \n\t', ''), ('directory', ''), (None, '')):
        lay_out(latest='2999a')
        put(f'{SYSTEM}/+VERSION', what)
        start([f'unparsed={word}.1.0'] * (0 if word[:1].isdigit() else 2),
              switched(f'{word}.1.0', '2999a'))
    lay_out(system='2147483648a')
    start(['no_data'], status=1)


def test_icu_format():
    data, taken = f'{DATASETS}/2016g.1.0/icutz', switched('2016f.1.0', '2016g.1.0')
    cases = [(None, name, 'file', 0o644, ()) for name in (  # no format, and so the same as none
        '44L.dat 44x.dat l.dat 44.dat 44l.dat.bak 44l.DAT 44lxdat 4ldat :l.dat 4\udcb2l.dat -4l.dat '
        '/l.dat /icutz44l.dat /../xicutz44l.dat').split()]
    cases += [(None, '44l.dat', what, mode, ()) for what, mode in (
        ('file', 0o770), ('link icutzformat.txt', 0o644), ('directory', 0o755))]
    cases += [(f'file \t{text}\nmore', f'{text}.dat', 'file', 0o004, ()) for text in (
        '44l', '2015b', '0e', '9l')]
    cases += [(f'file {text}', name, 'file', 0o644, ['not_taken']) for text, name in (
        ('4l', '44l.dat'), ('44L', '44l.dat'), ('', '44l.dat'), ('junk', '44x.dat'))]
    for system, name, what, mode, warnings in cases:
        lay_out(latest='2016g.1.0')
        put(f'{SYSTEM_ICU}/icutzformat.txt', system)
        put(f'{data}/icutz44l.dat')
        put(f'{data}/icutz{name}', what)
        os.chmod(f'{data}/icutz{name}', mode)
        start(warnings, {} if warnings else taken)
    for text in '44l', '45b', '46e', '47l':
        put(f'{DATASETS}/icu/icutz{text}.dat', 'file')
    put(data, 'link ../icu')
    put(f'{SYSTEM_ICU}/icutzformat.txt', f'file {os.listdir(data)[0][5:8]}')
    start((), taken)


def test_icu_link_cannot_be_made():
    lay_out(latest='2016g.1.0', localtime='./nowhere')
    put(ICU, 'directory')
    kept = [f'{text}: Is a directory' for text in (f'remove: could not remove {ICU}',
                                                   'unlink of ICU softlink failed')]
    start([*kept, f'create_symlink: from {ICU} to {DATASETS}/2016g.1.0/icutz: File exists',
           'no_data: File exists', *kept, 'reset_zone'],
          {ZONEINFO: f'link {SYSTEM}', LOCALTIME: f'link {DEFAULT_ZONE}'})


def test_zoneinfo_link_cannot_be_made():
    lay_out('directory')
    kept = [f'remove: could not remove {ZONEINFO}: Is a directory',
            'Unlink of zoneinfo softlink failed: Is a directory',
            f'create_symlink: from {ZONEINFO} to {SYSTEM}: File exists']
    start([f'unreadable={ZONEINFO}', 'bad_links: Invalid argument', *kept, 'no_data: File exists',
           *kept], status=1)


def test_local_time_link_cannot_be_made():
    lay_out(localtime='directory')
    put(f'{LOCALTIME}/entry', 'file')
    start([f'unreadable={LOCALTIME}', 'reset_zone: Invalid argument',
           f'create_symlink: from {LOCALTIME} to {DEFAULT_ZONE}: File exists'], status=1)


def test_marker_and_record_cannot_be_written():
    warnings, changes = lay_out_busy()
    put(f'{MARKER}/entry', 'file')
    put(RECORD, 'directory')
    warnings[1:1] = [f'Cannot touch file {MARKER}: Is a directory']
    start(warnings, {path: changes[path] for path in (ZONEINFO, ICU, LOCALTIME)})


def break_standard_error():
    reader, writer = os.pipe()
    os.dup2(writer, 2)
    os.close(reader)


def test_odd_surroundings():
    for prepare in lambda: os.close(2), break_standard_error:
        start((), lay_out_busy()[1], prepare=prepare)
    warnings, changes = lay_out_busy()
    start(warnings, changes | {RECORD: 'file'},
          prepare=lambda: resource.setrlimit(resource.RLIMIT_FSIZE, (0, 0)))
    lay_out_busy()
    start(warnings, {path: what.replace('file', '-rw-rw-rw-') for path, what in changes.items()},
          prepare=lambda: os.umask(0))


main()
