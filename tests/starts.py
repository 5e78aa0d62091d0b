#!/usr/bin/env -S python3 -EsB
"""Tests what starts of the program do to a device beside it.

Usage: starts.py [EMULATOR;]PROGRAM [OPTION of unittest, such as -k WORD]..."""

import os
import re
import sys
import unittest

from device import (BAD_LINKS, DATASETS, DEFAULT_ZONE, ICU, INCOMPATIBLE, LATEST, LOCALTIME, MARKER,
                    NO_DATA, NOT_TAKEN, RECORD, SYSTEM_ICU, SYSTEM_ZONEINFO, TZ, ZONEINFO,
                    ZONE_RESET, Device, links_to, switch)

READ_ONLY = '/usr/share/zoneinfo'
VERSION, FORMAT = f'{SYSTEM_ZONEINFO}/+VERSION', f'{SYSTEM_ICU}/icutzformat.txt'
SYSTEM, SWITCH = links_to('system'), switch('2016f.1.0', '2016g.1.0')

BUSY = ['2016e.1.0', '2016g.1.0', f'link {READ_ONLY}/Asia/Tokyo']
BUSY_WARNINGS = [INCOMPATIBLE, f'Correcting localtime link to {ZONEINFO}/Asia/Tokyo', ZONE_RESET]
BUSY_CHANGES = SWITCH | DEFAULT_ZONE | {MARKER: 'file'}


def unparsed(version):
    return [f'Cannot parse version string {version}, results.size() = 0',
            f'Cannot parse version string {version}']


class StartTest(unittest.TestCase):
    def check(self, links, warnings=(), changes={}, besides={}, **options):
        """Checks a start of a device with these links and this tree."""
        with self.subTest(f'{links} {besides}'[:300]):
            device.lay_out(*links)
            device.put(besides)
            return device.check_start(warnings, changes, **options)


class Selection(StartTest):
    def test_decision(self):
        # The system has 2016f. Updates of 2017 have another ICU format.
        table = '''
            current     latest      then      marker record              warnings
            system      2016g.1.0   2016g.1.0 none   2016f.1.0_2016g.1.0
            system      2017a.1.0   system    none   -                   NOT_TAKEN
            2016g.1.0   2016g.1.0   2016g.1.0 none   -                   NOT_TAKEN
            2016f.1.0   2016g.1.0   2016g.1.0 file   2016f.1.0_2016g.1.0
            2016e.1.0   none        system    file   -                   INCOMPATIBLE
            2016d.1.0   2016e.1.0   2016e.1.0 file   2016f.1.0_2016e.1.0 INCOMPATIBLE
            2017a.1.0   2016h.1.0   system    file   -                   INCOMPATIBLE NOT_TAKEN
            2017a.1.0   2017b.1.0   system    file   -                   INCOMPATIBLE NOT_TAKEN
            2016g.9876543210 none   system    none   -                   NO_DATA'''
        earlier = {MARKER: 'directory', '/var/db/icu': 'directory', RECORD: 'file with more'}
        for row in table.strip().splitlines()[1:]:
            current, latest, then, marker, record, *warnings = row.split()
            changes = {MARKER: None if marker == 'none' else marker, '/var/db/icu': None}
            changes |= DEFAULT_ZONE | (links_to(then) if then != current else {})
            changes |= {RECORD: f'file {record}'} if record != '-' else {}
            self.check([current, None if latest == 'none' else latest, 'link ./nowhere'],
                       [globals()[name] for name in warnings] + [ZONE_RESET], changes, earlier)

    def test_bad_links(self):
        for text in (f'{SYSTEM_ZONEINFO}/', READ_ONLY, f'{TZ}/tz/1', f'{TZ}/tz//x',
                     f'{TZ}/tzx/1/x', 'tz/1a/x', f'/x{TZ}/tz/1/x'):
            self.check([f'link {text}'], [f'Bad zoneinfo link {text}', BAD_LINKS], SYSTEM)
        for text in (f'{TZ}/tz/', f'{TZ}/tzx/1a', 'tz/1a', SYSTEM_ZONEINFO, f'/x{TZ}/tz/1a',
                     '/' + 2000 * 'x'):
            bad_path = f'mira_dataset::create_components: bad path {text[:1024]}'
            self.check(['2016g.1.0', f'link {text}'], [bad_path, NO_DATA], SYSTEM)
        self.check(['file'], [f'read_symlink: {ZONEINFO}', BAD_LINKS], SYSTEM)
        self.check(['2016g.1.0', 'file'], [f'read_symlink: {LATEST}', NO_DATA], SYSTEM)


class Versions(StartTest):
    def test_order(self):
        texts = '''0a 2014a 2014a.0 2014a.1 2014a.1.0 2014a.1.9 2014a.1.65536 2014a.9
            02014a.010 2014a.65536 2014aa 2014az.7 2014b 2014z.9 2015a 10000a 2147483647a'''.split()
        unset, warnings = {VERSION: None}, unparsed('.1.0')  # older than all
        for old, new in zip(texts, texts[1:]):
            self.check([old, new], warnings, switch(old, new) | {MARKER: 'file'}, unset)
            self.check([new, old], [*warnings, NOT_TAKEN], {}, {VERSION: 'directory'})

    def test_refused(self):
        texts = '''2014 a a2014 2014A 2014a. 2014a.b 2014a.1b 2014a.1. 2014a1 2014a.1.0.2
            +2014a 2014a.-1 2014a,1 2014a.1-1 2014` 2014{ 201/a 201:a 2014\udce9'''.split()
        for text in [*texts, ' 2014a', '2014a ', '2014a\n', f'2014{300 * "a"}.']:
            self.check(['system', f'link {DATASETS}/{text}'], [*unparsed(text), NOT_TAKEN])
        for text, version in ('x/', 'x'), ('1a//b', '1a/'), ('1a/../c', '1a/..'):
            self.check([f'link {DATASETS}/{text}'], [*unparsed(version), INCOMPATIBLE],
                       SYSTEM | {MARKER: 'file'})

    def test_system(self):
        for text, word in ((' \t\v\f\r\n2016f extra\n1a', '2016f'), ('1a.1', '1a.1'), (' \n', ''),
                           (f'2016{50_000 * "f"}\v', f'2016{50_000 * "f"}'), ('\udcff', '\udcff')):
            bad = [] if word[:5] == '2016f' else unparsed(f'{word}.1.0')
            self.check([None, '2999a'], [*bad, 'Bad zoneinfo link ', BAD_LINKS, *bad, *bad],
                       switch(f'{word}.1.0', '2999a'), {VERSION: f'file {text}'})
        self.check([], [NO_DATA], besides={VERSION: 'file 2147483648a'}, status=1)


class IcuData(StartTest):
    def check_format(self, taken, system, name, what='file'):
        data = f'{DATASETS}/2016g.1.0/icutz'
        besides = {FORMAT: system, f'{data}/icutz44l.dat': None, f'{data}/{name}': what}
        self.check(['system', '2016g.1.0'], [] if taken else [NOT_TAKEN], SWITCH if taken else {},
                   besides)

    def test_format(self):
        for text in '44l', '044l', '9e', 17 * '2' + 'b':
            self.check_format(True, f'file \t{text}\r\nmore', f'icutz{text}.dat')
        for text in '44lx', '44L', '4l', '44', '':
            self.check_format(False, f'file {text}', 'icutz44l.dat')

    def test_no_format(self):
        self.check_format(False, 'file junk', 'icutz44x.dat')
        for name in '''44L.dat 44|.dat l.dat 44.dat 44l.dat.bak 44l.DAT 44lxdat :l.dat 4\udcb2l.dat
                44l 44le.dat /l.dat /icutz44l.dat'''.split():
            self.check_format(True, None, f'icutz{name}')  # none, as the system
        self.check_format(True, None, 'xicutz44l.dat')
        self.check(['system', f'link {DATASETS}/2016g.1.0'], [], SWITCH, {FORMAT: None})

    def test_kind_of_file(self):
        for what in 'link icutzformat.txt', 'directory':
            self.check_format(False, 'file 44l', 'icutz44l.dat', what)
        device.lay_out('system', '2016g.1.0')
        os.chmod(device.outside(f'{DATASETS}/2016g.1.0/icutz/icutz44l.dat'), 0o773)
        device.check_start([NOT_TAKEN])

    def test_first_file(self):
        device.lay_out('system', '2016g.1.0')
        icu = f'{DATASETS}/icu'
        for number in range(30, 60):
            device.put({f'{icu}/icutz{number}e.dat': 'file', f'{icu}/{number}': 'file'})
        first = next(name for name in os.listdir(device.outside(icu)) if 'icutz' in name)
        device.put({f'{DATASETS}/2016g.1.0/icutz': 'link ../icu', FORMAT: f'file {first[5:8]}'})
        os.utime(device.outside(icu), (2**31, 2**31))  # past a 32-bit long
        device.check_start([], SWITCH)


class LocalTime(StartTest):
    def test_kept(self):
        for rest in '/No/Zone', '', 'X', '/../x':
            self.check(['system', None, f'link {ZONEINFO}{rest}'])

    def test_corrected(self):
        for rest in '/Asia/Tokyo', f'/Asia/..{255 * "/"}', '':
            self.check(['system', None, f'link {READ_ONLY}{rest}'],
                       [f'Correcting localtime link to {ZONEINFO}{rest}'],
                       {LOCALTIME: f'link {ZONEINFO}{rest}'})

    def test_reset(self):
        for rest in '.default/Asia/Tokyo', '/Asia/Tokyo/', '/Gone', f'/%d{255 * "x"}':
            correcting = f'Correcting localtime link to {ZONEINFO}{rest}'
            self.check(['system', None, f'link {READ_ONLY}{rest}'], [correcting, ZONE_RESET],
                       DEFAULT_ZONE, {f'{SYSTEM_ZONEINFO}/Gone': 'link nowhere'})
        for text in ('../zoneinfo/x', f'{TZ}/zoneinf', '/usr/share/zoneinfX/x',
                     f'/x{READ_ONLY}/x', f'/x{ZONEINFO}', DATASETS):
            self.check(['system', None, f'link {text}'], [ZONE_RESET], DEFAULT_ZONE)
        warnings = [f'read_symlink: {LOCALTIME}', f'{ZONE_RESET}: Invalid argument']
        self.check(['system', None, 'directory'], warnings, DEFAULT_ZONE)


class Failures(StartTest):
    def test_icu_link(self):
        remove = [f'remove: could not remove {ICU}: Is a directory',
                  'unlink of ICU softlink failed: Is a directory']
        create = f'create_symlink: from {ICU} to {DATASETS}/2016g.1.0/icutz: File exists'
        self.check(['system', '2016g.1.0', None],
                   [*remove, create, f'{NO_DATA}: File exists', *remove, ZONE_RESET],
                   {ZONEINFO: f'link {SYSTEM_ZONEINFO}'} | DEFAULT_ZONE, {ICU: 'directory'})

    def test_directory(self):
        create = f'create_symlink: from {ZONEINFO} to {SYSTEM_ZONEINFO}'
        warnings = ['Bad zoneinfo link ', BAD_LINKS, create, NO_DATA, create]
        self.check([], [f'{text}: No such file or directory' for text in warnings],
                   besides={TZ: None}, status=1)
        warnings = [f'read_symlink: {LATEST}', NO_DATA, f'remove: could not remove {ZONEINFO}',
                    'Unlink of zoneinfo softlink failed', create]
        self.check([], [f'{text}: Not a directory' for text in warnings],
                   besides={TZ: 'file'}, status=1)

    def test_marker_and_record(self):
        touch = f'Cannot touch file {MARKER}: Is a directory'
        self.check(BUSY, [INCOMPATIBLE, touch, *BUSY_WARNINGS[1:]],
                   SWITCH | DEFAULT_ZONE | {RECORD: 'file'},
                   {f'{MARKER}/entry': 'file', '/var/db/icu/entry': 'file'},
                   before=['sh', '-c', 'ulimit -f 0; "$0" "$@"'])
        self.check(['system', '2016g.1.0'], [], links_to('2016g.1.0'), {RECORD: 'directory'})

    def test_standard_error(self):
        modes = {MARKER: '0o100666', RECORD: '0o100666 2016f.1.0_2016g.1.0'}
        self.check(BUSY, [], BUSY_CHANGES | modes, before=['sh', '-c', 'umask 0; "$0" "$@" 2>&-'])
        reader, writer = os.pipe()
        os.close(reader)
        self.check(BUSY, [], BUSY_CHANGES, stderr=writer)


STRACE = 'strace -y --quiet=all -E ASAN_OPTIONS=detect_leaks=0 -o /dev/stdout'.split()


def disturb(call, path, how):
    return [*STRACE, '-P', path, f'-einject=/{call}:{how}']


@unittest.skipIf(';' in ''.join(sys.argv[1:2]), "strace would trace the emulator")
class Traces(StartTest):
    def calls(self, pattern, process):
        """Returns the calls that match; checks that all that is opened is closed."""
        text = re.search(rf'(?ms)^\w+\([^\n]*"{TZ}/".*', os.fsdecode(process.stdout))[0]
        opened = re.findall(r'(?m)^open.* = \d+(</.*>)$', text)
        self.assertCountEqual(opened, re.findall(r'(?m)^close\(\d+(</.*>)\) += 0$', text))
        return re.findall(rf'(?m)^{pattern}', text)

    def test_quiet_start(self):
        process = self.check([], before=STRACE)
        self.assertEqual(self.calls(r'\w+\([^"]*"(/(?:usr|var)/[^"]*)"', process),
                         [f'{TZ}/', f'{TZ}/tz/', MARKER, '/var/db/icu', VERSION, FORMAT, LATEST,
                          ZONEINFO, VERSION, FORMAT, LOCALTIME])
        self.assertEqual(len(self.calls(r'fcntl.*, 0x40.*, 0x4\)', process)), 2)

    def test_busy_start(self):
        for words in [], ['-n'], ['-h'], ['--version'], ['/x', 'y']:
            process = self.check(BUSY, BUSY_WARNINGS, BUSY_CHANGES, before=STRACE, arguments=words)
            self.assertEqual(len(self.calls(r'write\([12]\b', process)), len(BUSY_WARNINGS))
            self.assertTrue(self.calls(rf'.*"{MARKER}", O_RDWR\|O_CREAT(\|O_L\w+)?, 0666', process))

    def test_failed_call(self):
        create = f'create_symlink: from {LOCALTIME} to {ZONEINFO}'
        self.check(['system', None, f'link {READ_ONLY}'],
                   [f'Correcting localtime link to {ZONEINFO}', create, ZONE_RESET,
                    f'{create}/America/Los_Angeles'],
                   {LOCALTIME: None}, status=1, before=disturb('symlink', LOCALTIME, 'error=EIO'))

    def test_caveats(self):
        changes = switch('2016f.1.1', '2016g.1.0') | {MARKER: 'file', LOCALTIME: f'link {ZONEINFO}'}
        for call, path, lost in (
                ('symlink', ZONEINFO, [MARKER, RECORD]), ('unlink', ICU, [ICU, MARKER, RECORD]),
                ('symlink', ICU, [ICU, MARKER, RECORD]), ('open', MARKER, [MARKER, RECORD]),
                ('open', RECORD, [RECORD]), ('symlink', LOCALTIME, [LOCALTIME])):
            with self.subTest(f'before {call} {path}'):
                device.lay_out('2016f.1.1', '2016g.1.0', f'link {READ_ONLY}')
                process = device.start(*disturb(call, path, 'signal=KILL'))
                self.assertIn(process.returncode, [-9, 137])
                seen = device.snapshot()  # a start deletes a marker
                device.start()
                seen |= device.snapshot()
                missing = [path for path in changes if seen.get(path) != changes[path]]
                self.assertCountEqual(missing, lost)


if __name__ == '__main__':
    command = sys.argv.pop(1).split(';') if len(sys.argv) > 1 else sys.exit(__doc__)
    device = Device(os.path.dirname(command[-1]), 'device', command)
    result = unittest.main(failfast=True, exit=False).result
    sys.exit(not result.wasSuccessful() or not result.testsRun)
