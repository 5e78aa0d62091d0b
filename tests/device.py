"""A device: a directory with the program in it, which starts there by chroot. Tests stay outside,
and write into it through no link."""

import fcntl
import os
import pathlib
import re
import shutil
import subprocess
import sys
import unittest

unittest.TestCase.maxDiff = None

SYSTEM_ZONEINFO = '/usr/share/zoneinfo.default'
SYSTEM_ICU = '/usr/share/icu'
TZ = '/var/db/timezone'
DATASETS = f'{TZ}/tz'
LATEST = f'{TZ}/tz_latest'
ZONEINFO = f'{TZ}/zoneinfo'
ICU = '/var/db/icutz'
LOCALTIME = f'{TZ}/localtime'
MARKER = f'{TZ}/needs_cleanup'
RECORD = f'{TZ}/TZVersionDiffRecord'
DEFAULT_ZONE = {LOCALTIME: f'link {ZONEINFO}/America/Los_Angeles'}

BAD_LINKS = 'Invalid current symlinks; resetting to system partition'
INCOMPATIBLE = 'Symlink points at data incompatible with installed system'
NOT_TAKEN = 'New update not compatible or older version'
NO_DATA = 'Unable to locate data; resetting to system partition'
ZONE_RESET = 'localtime link invalid; resetting to America/Los_Angeles'
ERROR = re.compile(r': [A-Z][^:\n]*\Z')  # ends every warning

KINDS = {0o100644: 'file', 0o120777: 'link', 0o40755: 'directory'}
ENVIRONMENT = {'PATH': os.environ.get('PATH', os.defpath) + ':/usr/sbin'}
ENVIRONMENT |= dict.fromkeys('DEBUG HOME ICU_DATA LANG LC_ALL TZ TZDIR'.split(), '/elsewhere')


def links_to(version):
    """Returns the data links to "system" or to the update of a version."""
    if version == 'system':
        return {ZONEINFO: f'link {SYSTEM_ZONEINFO}', ICU: None}
    update = f'link {DATASETS}/{version}'
    return {ZONEINFO: f'{update}/zoneinfo', ICU: f'{update}/icutz'}


def switch(before, after):
    """Returns what a switch changes: the data links and the record."""
    return links_to(after) | {RECORD: f'file {before}_{after}'}


class Device:
    """A tree is a dictionary. It says of each path what is there: a "directory", a "file" with its
    content, a "link" with its text, or None."""

    def __init__(self, directory, name, command, tools=()):
        """Makes the device anew, with the tools and the command: the program, behind an emulator
        if any. Locks the program to the end."""
        fcntl.flock(os.open(command[-1], os.O_RDONLY), fcntl.LOCK_EX)
        os.umask(0o022)
        self.place = f'{os.path.realpath(directory)}/{name}'
        ours = os.path.isfile(f'{self.place}/mira_tzlinks') or not os.path.lexists(self.place)
        mounts = pathlib.Path('/proc/self/mountinfo').read_text('unicode_escape')
        if not ours or os.fsencode(self.place).decode('latin1') in mounts:
            sys.exit(f'{self.place} is kept: no device, or something is mounted in it')
        subprocess.run(['rm', '-rf', '--one-file-system', '--', self.place], check=True)
        for program in [command[-1], *map(shutil.which, [*command[:-1], *tools])]:
            ldd = subprocess.run(['ldd', program], capture_output=True, text=True).stdout
            libraries = re.findall(r'(/\S+) \(0x', ldd)
            for path in [f'/{os.path.basename(program)}', *libraries]:
                os.makedirs(os.path.dirname(self.place + path), exist_ok=True)
                shutil.copy(path if path in libraries else program, self.place + path)
        self.command = [f'/{os.path.basename(word)}' for word in command]
        self.before_chroot, self.chroot = self.way_in()
        self.fixed = set()
        self.fixed = {self.place + path for path in self.snapshot()}

    def way_in(self):
        """Returns the words before a command that calls chroot, and those that call it."""
        user = f'--userspec=+{os.getuid()}:+{os.getgid()}'
        for way, options in ([], []), (['unshare', '--map-root-user'], []), (['sudo'], [user]):
            enter = ['env', *way, 'chroot', '/', 'true']
            if subprocess.run(enter, env=ENVIRONMENT, capture_output=True).returncode == 0:
                break
        else:
            sys.exit('entering a device takes root, a user namespace or sudo')
        if b'__asan_init' in pathlib.Path(f'{self.place}/mira_tzlinks').read_bytes():
            os.mkdir(f'{self.place}/proc')  # which AddressSanitizer reads
            mount = 'mount --rbind /proc "$0/proc" && exec "$@"'
            way += ['unshare', '--mount', 'sh', '-c', mount, self.place]
        return ['env', *way], ['chroot', *options, self.place]

    def outside(self, path):
        """Returns where a path is outside; fails for a link before its last name."""
        parent, name = os.path.split(self.place + path)
        if os.path.realpath(parent) != parent or name == '..' or path[0] != '/':
            raise ValueError(f'{path} may lead out of the device')
        return f'{parent}/{name}'

    def put(self, tree):
        """Makes each path what the tree says."""
        for path, what in tree.items():
            path = self.outside(path)
            shutil.rmtree(path, ignore_errors=True)
            pathlib.Path(path).unlink(missing_ok=True)
            kind, _, content = (what or '').partition(' ')
            assert kind in ('', *KINDS.values()), what
            os.makedirs(path if kind == 'directory' else os.path.dirname(path), exist_ok=True)
            if kind == 'link':
                os.symlink(content, path)
            elif kind == 'file':
                pathlib.Path(path).write_bytes(os.fsencode(content))

    def snapshot(self):
        """Returns the tree without programs. An odd mode stands for its kind."""
        tree = {}
        for parent, directories, files in os.walk(self.place):
            for path in {f'{parent}/{name}' for name in directories + files} - self.fixed:
                mode = os.lstat(path).st_mode
                what = KINDS.get(mode, oct(mode))
                if os.path.islink(path):
                    what += f' {os.readlink(path)}'
                elif os.path.isfile(path) and os.path.getsize(path):
                    what += ' ' + os.fsdecode(pathlib.Path(path).read_bytes())
                tree[path.removeprefix(self.place)] = what
        return tree

    def lay_out(self, current='system', latest=None, localtime=f'link {ZONEINFO}/Asia/Tokyo'):
        """Makes /usr/share and /var anew; the system has version 2016f, ICU format 44l. A link is
        "system", the version of an update (of 2017: another format), or as in a tree."""
        self.put({'/usr/share': None, '/var': None, DATASETS: 'directory', ICU: 'link ./stale',
                  f'{SYSTEM_ZONEINFO}/+VERSION': 'file 2016f\n', LOCALTIME: localtime,
                  f'{SYSTEM_ZONEINFO}/Asia/Tokyo': 'file', f'{SYSTEM_ICU}/icutz77e.dat': 'file',
                  f'{SYSTEM_ICU}/icutzformat.txt': 'file 44l\n'})
        for path, what in (ZONEINFO, current), (LATEST, latest):
            if what and what[0].isdigit():
                update, icu_format = f'{DATASETS}/{what}', '48l' if '2017' in what else '44l'
                self.put({LATEST: f'link {update}'} if path == LATEST else links_to(what))
                self.put({f'{update}/zoneinfo/+VERSION': 'file 1999z',
                          f'{update}/icutz/icutzformat.txt': 'file 77e',
                          f'{update}/icutz/icutz{icu_format}.dat': 'file'})
            else:
                self.put({path: f'link {SYSTEM_ZONEINFO}' if what == 'system' else what})

    def start(self, *before, arguments=(), stderr=subprocess.PIPE):
        """Starts the program behind these words; returns the ended process."""
        command = [*self.before_chroot, *before, *self.chroot, *self.command, *arguments]
        return subprocess.run(command, env=ENVIRONMENT, stdin=subprocess.DEVNULL,
                              stdout=subprocess.PIPE, stderr=stderr, timeout=20)

    def check_start(self, warnings=(), changes={}, status=0, before=(), **options):
        """Starts the program. Fails, and shows why, unless it writes these warnings, which may
        lack the error at the end, and makes these changes. Returns the process."""
        old = self.snapshot()
        process = self.start(*before, **options)
        new = self.snapshot()
        texts = [text if ERROR.search(text) else f'{text}: any error' for text in warnings]
        expected = [*(f'mira_tzlinks: {text}' for text in texts), '']
        output = os.fsdecode(process.stderr or b'')
        seen = re.split(r'\n(?=mira_tzlinks: |\Z)', output)  # a text may hold a line end
        for at, line in enumerate(seen):
            if ERROR.sub(': any error', line) in expected:
                seen[at] = ERROR.sub(': any error', line)
        changed = {path: new.get(path) for path in old | new if old.get(path) != new.get(path)}
        changes = {path: what for path, what in changes.items() if old.get(path) != what}
        unittest.TestCase().assertEqual(
            (expected, status, changes), (seen, process.returncode, changed), '(-expected, +seen)')
        return process
