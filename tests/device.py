"""The words that lay out a device, start it, and compare what happens with what should. A device is
a directory with the program in it, which a process of ours enters by chroot."""

import ctypes
import difflib
import fcntl
import itertools
import os
import re
import shutil
import signal
import stat
import subprocess
import sys

TZ, TREE, SYSTEM_ICU = '/var/db/timezone', '/usr/share/zoneinfo', '/usr/share/icu'
DATASETS, LATEST, ZONEINFO, ICU = f'{TZ}/tz', f'{TZ}/tz_latest', f'{TZ}/zoneinfo', '/var/db/icutz'
SYSTEM, LOCALTIME, MARKER = f'{TREE}.default', f'{TZ}/localtime', f'{TZ}/needs_cleanup'
RECORD, DEFAULT_ZONE = f'{TZ}/TZVersionDiffRecord', f'{ZONEINFO}/America/Los_Angeles'
RESET_ZONE = {LOCALTIME: f'link {DEFAULT_ZONE}'}

WARNINGS = {  # by word; what follows a word and `=` takes the place of the braces
    'bad_link': 'Bad zoneinfo link {}', 'correcting': 'Correcting localtime link to {}',
    'bad_links': 'Invalid current symlinks; resetting to system partition',
    'bad_path': 'mira_dataset::create_components: bad path {}',
    'incompatible': 'Symlink points at data incompatible with installed system',
    'no_data': 'Unable to locate data; resetting to system partition',
    'no_link': 'read_symlink: {}: Invalid argument',
    'not_taken': 'New update not compatible or older version',
    'reset_zone': 'localtime link invalid; resetting to America/Los_Angeles',
    'unparsed': 'Cannot parse version string {0}, results.size() = 0\n'
                'Cannot parse version string {0}'}
ERROR = re.compile(r': [A-Z][^:\n]*\Z')  # the text of an errno, with which every warning ends
VARIABLES = 'DEBUG HOME ICU_DATA ICU_TIMEZONE_FILES_DIR LANG LC_ALL PATH TZ TZDIR'  # not heeded
command, arguments = ['/mira_tzlinks'], itertools.cycle([[], ['-n'], ['--version'], ['-h', '/x']])

WORDS = dict(system=f'link {SYSTEM}', directory='directory', none=None, file=f'file {DATASETS}/1a')
KINDS = {'-rw-r--r--': 'file', 'drwxr-xr-x': 'directory', 'lrwxrwxrwx': 'link'}
OLD = 2208988800, 2**31 - 1  # 2040, or the last date of a file system that ends before
harness = set()  # what a device holds for our sake, by path
libc = ctypes.CDLL(None)


def put(tree):
    """Makes each path a `directory`, `link TEXT` or `file CONTENT`; None removes what is there."""
    assert harness, 'outside of a device'
    for path, what in tree.items():
        shutil.rmtree(path, ignore_errors=True)
        if os.path.lexists(path):
            os.remove(path)
        kind, _, content = (what or '').partition(' ')
        os.makedirs(path if kind == 'directory' else os.path.dirname(path), exist_ok=True)
        if kind == 'file':
            open(path, 'wb').write(os.fsencode(content))
        elif kind == 'link':
            os.symlink(content, path)


def snapshot():
    """Returns the device's tree; an odd mode takes a word's place, ` *` marks a time not OLD."""
    seen = {}
    for parent, directories, files in os.walk('/'):
        directories[:] = [name for name in directories if os.path.join(parent, name) != '/proc']
        for path in {os.path.join(parent, name) for name in directories + files} - harness:
            status = os.lstat(path)
            mode, content, mark = stat.filemode(status.st_mode), '', ''
            if mode[0] != 'd':
                content = os.readlink(path) if mode[0] == 'l' else open(path, 'rb').read()
                mark = '*' * (int(status.st_mtime) not in OLD)
            seen[path] = ' '.join(filter(None, (KINDS.get(mode, mode), os.fsdecode(content), mark)))
    return seen


def data_links(version, before=None):
    """Returns the tree of the data links to a version or "system", and of a switch's record."""
    record = {RECORD: f'file {before}_{version}'} if before else {}
    return record | {ZONEINFO: WORDS.get(version, f'link {DATASETS}/{version}/zoneinfo'),
                     ICU: None if version in WORDS else f'link {DATASETS}/{version}/icutz'}


def lay_out(current='system', latest='none', localtime=f'{ZONEINFO}/Asia/Tokyo', besides={}):
    """Makes the device anew. A link is given by one of WORDS, by its text, which begins with a
    slash, a dot or `tz/`, or by the version of an update; 2017's have another ICU format."""
    put({'/usr/share': None, '/var': None, DATASETS: 'directory', ICU: 'link ./stale',
         f'{SYSTEM}/+VERSION': 'file 2016f\n', f'{SYSTEM}/Asia/Tokyo': 'file',
         f'{SYSTEM_ICU}/icutzformat.txt': 'file 44l\n', f'{SYSTEM_ICU}/icutz77e.dat': 'file'})
    for path, text in (ZONEINFO, current), (LATEST, latest), (LOCALTIME, localtime):
        if text in WORDS or text.startswith(('/', '.', 'tz/')) or path == LOCALTIME:
            put({path: WORDS.get(text, f'link {text}')})
        else:
            update, icu_format = f'{DATASETS}/{text}', '48l' if '2017' in text else '44l'
            put({f'{update}/zoneinfo/+VERSION': 'file 1999z', f'{update}/icutz/icutzformat.txt':
                 'file 77e', f'{update}/icutz/icutz{icu_format}.dat': 'file'})
            put(data_links(text) if path == ZONEINFO else {path: f'link {update}'})
    put(besides)


def lay_out_busy():
    """Lays out a device whose next start changes all it can; returns its warnings and changes."""
    lay_out('2016e.1.0', '2016g.1.0', '/usr/share/zoneinfo/No/Zone')
    return (['incompatible', f'correcting={ZONEINFO}/No/Zone', 'reset_zone: ' + os.strerror(2)],
            data_links('2016g.1.0', '2016f.1.0') | RESET_ZONE | {MARKER: 'file'})


def run(*before, prepare=None):
    """Runs the program to its end, behind a command and after a call of `prepare`, if any."""
    process = subprocess.run([*before, *command, *next(arguments)], preexec_fn=prepare,
                             env=dict.fromkeys(VARIABLES.split(), '/elsewhere'),
                             stdin=subprocess.DEVNULL, capture_output=True, timeout=20)
    if b'PTRACE' in process.stderr:
        sys.exit(f'system calls cannot be traced here: {process.stderr.splitlines()[0]}')
    return process


def start(warnings=(), changes={}, status=0, before=(), prepare=None):
    """Runs the program and checks its warnings, its exit status, and the tree of all its changes;
    returns the process. A warning without `: ERROR` may end with that of any call."""
    for path in snapshot():
        os.utime(path, (OLD[0], OLD[0]), follow_symlinks=False)
    tree = snapshot() | {path: what and f'{what} *' for path, what in changes.items()}
    process, texts = run(*before, prepare=prepare), []
    expected, seen = {item for item in tree.items() if item[1]}, {*snapshot().items()}
    for warning in warnings:
        word, colon, error = warning.partition(': ')
        name, _, argument = word.partition('=')
        for text in WARNINGS.get(name, word).split('\n'):
            text = text.format(argument) + colon + error
            texts.append(f'mira_tzlinks: {text}' + ': any error' * (not ERROR.search(text)))
    lines = re.split(r'\n(?=mira_tzlinks: |\Z)', os.fsdecode(process.stdout + process.stderr))
    lines = [line if line in texts else ERROR.sub(': any error', line) for line in lines]
    compare([*texts, '', f'exit status {status}', *map(': '.join, sorted(expected - seen))],
            [*lines, f'exit status {process.returncode}', *map(': '.join, sorted(seen - expected))])
    return process


def compare(expected, seen):
    """Shows both lists of lines and ends this process, unless they are the same."""
    if expected != seen:
        lines = difflib.unified_diff(expected, seen, 'expected', 'seen', n=99, lineterm='')
        sys.exit('\n'.join(line[:300] for line in lines))


def main(*tools):
    """Runs each test of a script, or row of a test's table, that has every WORD in its title."""
    *emulator, program = [*sys.argv, ''][1].split(';')  # behind an emulator, calls are not traced
    command[:0] = [f'/{os.path.basename(path)}' for path in emulator]
    tests = [function for name, function in vars(sys.modules['__main__']).items()
             if name.startswith('test_') and not (emulator and 'traced' in name)]

    def run_tests():
        passed = 0
        for test in tests:
            text, _, table = (test.__doc__ or '').partition('\n\n')
            first = test.__code__.co_firstlineno + (text.count('\n') + 4 if table else 0)
            for line, row in enumerate(table.splitlines()[1:-1] or [''], first):
                title = f'{test.__name__} {row.strip()}'
                if all(word in title for word in sys.argv[2:]):
                    print(f'{sys.argv[0]}:{line}: {title}', flush=True)
                    test(*row.partition('#')[0].format(**globals()).split())
                    passed += 1
        return passed or sys.exit('no test has every WORD')

    in_device(run_tests, program, f'{os.path.dirname(program) or "."}/device', [*emulator, *tools])


def in_device(action, program, place, tools=(), keep=False):
    """Becomes root, makes `place` a device with the program and the tools, calls `action` in it and
    ends this process: with 0 when that returns true, and with 1 and a kept device when it fails."""
    become_root()
    copies = {'/dev/null': '/dev/null', '/mira_tzlinks': program}
    copies |= {f'/{os.path.basename(tool)}': tool for tool in tools}
    for name, tool in [*copies.items()]:
        copies[name] = path = shutil.which(tool, os.F_OK) or sys.exit(f'there is no program {tool}')
        ldd = subprocess.run(['ldd', path], env={}, capture_output=True, text=True).stdout
        copies |= {path: path for path in re.findall(r'\t(?:\S+ => )?(/\S+) \(0x', ldd)}
    fcntl.flock(os.open(copies['/mira_tzlinks'], os.O_RDONLY), fcntl.LOCK_EX)  # after another run
    signal.signal(signal.SIGCHLD, signal.SIG_DFL)  # whatever the caller's is
    remove(place)
    signals = signal.SIGINT, signal.SIGTERM, signal.SIGHUP, signal.SIGQUIT, signal.SIGCHLD
    signal.pthread_sigmask(signal.SIG_BLOCK, signals)
    libc.prctl(1, signal.SIGTERM)  # for when our own parent has ended
    os.umask(0o022)
    for name, path in copies.items():
        os.makedirs(os.path.dirname(place + name), exist_ok=True)
        shutil.copy(path, place + name)
    if (child := os.fork()) == 0:
        signal.pthread_sigmask(signal.SIG_UNBLOCK, signals)
        if b'__asan_init' in open(f'{place}/mira_tzlinks', 'rb').read():  # reads /proc
            os.mkdir(f'{place}/proc')
            if (libc.unshare(0x20000) or libc.mount(None, b'/', None, 0x44000, None)
                    or libc.mount(b'/proc', os.fsencode(f'{place}/proc'), None, 0x5000, None)):
                sys.exit('AddressSanitizer takes a mount namespace, which is refused here')
        os.chroot(place)
        os.chdir('/')
        harness.update(snapshot(), ['/trace'])
        sys.exit(not action())
    os.setpgid(child, child)
    signal.sigwait(signals)  # the child has ended, or is to end now
    os.killpg(child, signal.SIGKILL)
    status = os.waitstatus_to_exitcode(os.waitpid(child, 0)[1])
    if status == 1 or status == 0 and keep:
        subprocess.run(['chown', '-Rh', os.environ.get('SUDO_UID', '0'), place])
        print(f'The device is kept: {place}', file=sys.stderr)
    else:
        remove(place)
    sys.exit(f'ended by signal {-status}' if status < 0 else status)


def become_root():
    for way in [], ['unshare', '--map-root-user'], ['sudo']:
        python = ['env', *way, sys.executable]
        chroot = [*python, '-c', 'import os; os.chroot("/")']
        if subprocess.run(chroot, capture_output=True).returncode == 0:
            return way and os.execvp('env', [*python, *sys.orig_argv[1:]])
    sys.exit('a device is entered by chroot, which takes root, a user namespace or sudo')


def remove(place):
    """Removes what is there, unless something is mounted in it."""
    mounts = open('/proc/self/mountinfo', 'rb').read().decode('unicode_escape')
    if os.fsencode(os.path.realpath(place)).decode('latin1') in mounts:
        sys.exit(f'{place} is not removed: something is mounted in it')
    subprocess.run(['rm', '-rf', '--one-file-system', '--', place], check=True)
