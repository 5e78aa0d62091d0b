"""A device, and the words to lay one out, start it, and compare what happened with what should.

A device is a directory with the program in it, which a process of ours enters by chroot: paths are
the system's own in there, and nothing that a test does can reach what lies outside.
"""

import ctypes
import difflib
import fcntl
import os
import re
import shutil
import signal
import stat
import subprocess
import sys

TZ, SYSTEM, SYSTEM_ICU = '/var/db/timezone', '/usr/share/zoneinfo.default', '/usr/share/icu'
DATASETS, LATEST, ZONEINFO, ICU = f'{TZ}/tz', f'{TZ}/tz_latest', f'{TZ}/zoneinfo', '/var/db/icutz'
LOCALTIME, DEFAULT_ZONE = f'{TZ}/localtime', f'link {ZONEINFO}/America/Los_Angeles'
MARKER, RECORD = f'{TZ}/needs_cleanup', f'{TZ}/TZVersionDiffRecord'
LONG = '/' + 1023 * 'x'  # as much as is read of a link

# The words for warnings. What follows a word and `=` takes the place of the braces.
WARNINGS = {
    'bad_link': 'Bad zoneinfo link {}', 'correcting': 'Correcting localtime link to {}',
    'bad_links': 'Invalid current symlinks; resetting to system partition',
    'bad_path': 'mira_dataset::create_components: bad path {}',
    'incompatible': 'Symlink points at data incompatible with installed system',
    'no_data': 'Unable to locate data; resetting to system partition',
    'no_zoneinfo': 'Bad zoneinfo link : No such file or directory',
    'no_link': 'read_symlink: {}: Invalid argument',
    'not_taken': 'New update not compatible or older version',
    'reset_zone': 'localtime link invalid; resetting to America/Los_Angeles',
    'unparsed': 'Cannot parse version string {0}, results.size() = 0\n'
                'Cannot parse version string {0}'}
# No start may heed these; AddressSanitizer does, and cannot look for leaks under a tracer.
VARIABLES = 'DEBUG DESTDIR HOME ICU_DATA ICU_TIMEZONE_FILES_DIR LANG LC_ALL PATH ROOT TZ TZDIR'
ENVIRONMENT = {**dict.fromkeys(VARIABLES.split(), '/elsewhere'), 'ASAN_OPTIONS': 'detect_leaks=0'}
command = ['/mira_tzlinks', '-n', '--version', '/elsewhere']

WORDS = {'system': f'link {SYSTEM}', 'file': 'file', 'directory': 'directory', 'none': None}
KINDS = {'-rw-r--r--': 'file', 'drwxr-xr-x': 'directory', 'lrwxrwxrwx': 'link'}
OLD = 2208988800, 2**31 - 1  # 2040, and what that is on a file system whose dates end before
harness = None  # in a device, a snapshot of what it holds for our sake


def put(tree):
    """Puts at each path, in place of what is there, what a snapshot shows so; by None nothing."""
    assert harness is not None, 'outside of a device'
    for path, what in tree.items():
        shutil.rmtree(path, ignore_errors=True)
        if os.path.lexists(path):
            os.remove(path)
        os.makedirs(os.path.dirname(path), exist_ok=True)
        kind, _, content = (what or '').partition(' ')
        if kind == 'file':
            with open(path, 'wb') as file:
                file.write(os.fsencode(content))
        elif kind:
            os.mkdir(path) if kind == 'directory' else os.symlink(content, path)


def snapshot():
    """Returns, by path, what is on the device: `link TEXT`, `file CONTENT` or `directory`, an
    unusual mode in place of the word, and ` *` behind it unless its time is OLD."""
    seen = {}
    for parent, directories, files in os.walk('/'):
        directories[:] = [name for name in directories if name != 'proc']
        for path in {os.path.join(parent, name) for name in directories + files} - harness.keys():
            status = os.lstat(path)
            mode, content = stat.filemode(status.st_mode), ''
            if mode[0] == 'l':
                content = ' ' + os.readlink(path)
            elif mode[0] == '-' and status.st_size:
                with open(path, 'rb') as file:
                    content = ' ' + os.fsdecode(file.read())
            seen[path] = KINDS.get(mode, mode) + content + ' *' * (int(status.st_mtime) not in OLD)
    return seen


def system_dataset(version):
    """Returns the tree of the system dataset, with a file that would be data in an update."""
    return {f'{SYSTEM}/+VERSION': f'file {version}\n', f'{SYSTEM}/Asia/Tokyo': 'file',
            f'{SYSTEM_ICU}/icutzformat.txt': 'file 44l\n', f'{SYSTEM_ICU}/icutz77e.dat': 'file'}


def update(version):
    """Returns the tree of an update, with texts that would count in the system dataset."""
    path, icu_format = f'{DATASETS}/{version}', '48l' if version.startswith('2017') else '44l'
    return {f'{path}/zoneinfo/+VERSION': 'file 1999z', f'{path}/icutz/icutzformat.txt': 'file 77e',
            f'{path}/icutz/icutz{icu_format}.dat': 'file'}


def data_links(version):
    """Returns the tree of the data links while a version, or "system", is current."""
    dataset = f'link {DATASETS}/{version}/'
    return {ZONEINFO: WORDS.get(version, dataset + 'zoneinfo'),
            ICU: None if version in WORDS else dataset + 'icutz'}


def switched(current, latest):
    """Returns the tree of what a switch from one version to another changes."""
    return data_links(latest) | {RECORD: f'file {current}_{latest}'}


def lay_out(current='system', latest='none', localtime=f'{ZONEINFO}/Asia/Tokyo', system='2016f'):
    """Makes the device anew. A link has a text that begins with a slash, a dot or `tz/`, is one of
    WORDS, or leads to the update of a version, which is then installed."""
    put({'/usr/share': None, '/var': None})
    put({DATASETS: 'directory', ICU: 'link ./stale', **system_dataset(system)})
    for path, text in (ZONEINFO, current), (LATEST, latest), (LOCALTIME, localtime):
        if text in WORDS or text.startswith(('/', '.', 'tz/')) or path == LOCALTIME:
            put({path: WORDS.get(text, f'link {text}')})
        else:
            links = data_links(text) if path == ZONEINFO else {path: f'link {DATASETS}/{text}'}
            put(update(text) | links)


def lay_out_busy():
    """Lays out a device whose next start changes all it can; returns its warnings and changes."""
    lay_out('2016e.1.0', '2016g.1.0', '/usr/share/zoneinfo/No/Zone')
    return (['incompatible', f'correcting={ZONEINFO}/No/Zone', 'reset_zone: ' + os.strerror(2)],
            switched('2016f.1.0', '2016g.1.0') | {LOCALTIME: DEFAULT_ZONE, MARKER: 'file'})


def run(*before, prepare=None):
    """Runs the program to its end, behind a command and after a call of `prepare`, if any."""
    process = subprocess.run([*before, *command], env=ENVIRONMENT, preexec_fn=prepare, timeout=20,
                             stdin=subprocess.DEVNULL, capture_output=True)
    if b'PTRACE' in process.stderr:
        sys.exit(f'system calls cannot be traced here: {os.fsdecode(process.stderr)}')
    return process


def start(warnings=(), changes={}, status=0, before=(), prepare=None):
    """Runs the program and checks its warnings, its exit status, and the tree of all its changes. A
    warning has `: ERROR` where a call has just failed, and any error is taken elsewhere."""
    for path in snapshot():
        os.utime(path, (OLD[0], OLD[0]), follow_symlinks=False)
    expected = snapshot()
    process = run(*before, prepare=prepare)
    seen = snapshot().items()
    for path, what in changes.items():
        parent = os.path.dirname(path)
        expected |= {parent: expected[parent].removesuffix(' *') + ' *', path: what and f'{what} *'}
    expected = {path: what for path, what in expected.items() if what}.items()
    texts, error_text = [], ': [A-Z][^:]*$'
    for warning in warnings:
        word, colon, error = warning.partition(': ')
        name, _, argument = word.partition('=')
        text = WARNINGS.get(name, word).format(argument) + colon + error
        for line in re.split('\n(?=Cannot)', text):
            any_error = '' if re.search(error_text, line) else ': any error'
            texts.append(f'mira_tzlinks: {line}{any_error}')
    lines = re.split(r'\n(?=mira_tzlinks: |\Z)', os.fsdecode(process.stdout + process.stderr))
    lines = [line if line in texts else re.sub(error_text, ': any error', line) for line in lines]
    compare([*texts, '', f'exit status {status}', *map(': '.join, sorted(expected - seen))],
            [*lines, f'exit status {process.returncode}', *map(': '.join, sorted(seen - expected))])


def compare(expected, seen):
    """Ends this process and shows both lists of lines, unless they are the same."""
    if expected != seen:
        signs = {'-': '  expected ', '+': '  seen     ', ' ': '           '}
        lines = [*difflib.unified_diff(expected, seen, n=99, lineterm='')][3:]
        sys.exit('\n'.join(signs[line[0]] + line[1:300] for line in lines))


def main(*tools):
    """Runs the tests of a script in a device beside PROGRAM: its functions named test_..., once or
    with each row of the table in their text, those that have every WORD in their titles."""
    *emulator, program = sys.argv[1].split(';')
    command[:0] = [f'/{os.path.basename(path)}' for path in emulator]
    tests = []
    for name, function in vars(sys.modules['__main__']).items():
        if name.startswith('test_'):
            text, _, table = (function.__doc__ or '').partition('\n\n')
            first = function.__code__.co_firstlineno + (text.count('\n') + 4 if table else 0)
            for line, row in enumerate(table.splitlines()[1:-1] or [''], first):
                if all(word in f'{name} {row}' for word in sys.argv[2:]):
                    tests.append((f'{sys.argv[0]}:{line}: {name} {row}', function, row))

    def run_tests():
        for title, function, row in tests:
            try:
                function(*row.partition('#')[0].format(**globals()).split())
            except BaseException:
                print(title, file=sys.stderr)
                raise
        print(f'{len(tests)} passed')
        return tests

    place = f'{os.path.dirname(program)}/device.{os.path.basename(sys.argv[0])}'
    in_device(run_tests, program, place.removesuffix('.py'), [*emulator, *tools])


def in_device(action, program, place, tools=(), keep=False):
    """Makes the directory `place` a device with the program and the tools, calls `action` in it and
    ends this process, with 0 when that returned true. Keeps the device when it did not or if asked.
    Another user becomes root for that, in a user namespace or by sudo."""
    if missing := [path for path in (program, *tools) if not shutil.which(path)]:
        sys.exit(f'there is no program {missing[0]}')
    become_root()
    signals = signal.SIGINT, signal.SIGTERM, signal.SIGHUP, signal.SIGCHLD
    signal.pthread_sigmask(signal.SIG_BLOCK, signals[:3])
    ctypes.CDLL(None).prctl(1, signal.SIGTERM)  # for when our own parent has ended
    os.umask(0o022)
    os.makedirs(place, exist_ok=True)
    lock = os.open(place, os.O_DIRECTORY | os.O_NOFOLLOW)
    fcntl.flock(lock, fcntl.LOCK_EX)  # after another run
    empty(place)
    signal.pthread_sigmask(signal.SIG_BLOCK, signals)
    child = os.fork()
    if child == 0:
        signal.pthread_sigmask(signal.SIG_UNBLOCK, signals)
        enter(place, program, tools)
        sys.exit(not action())
    os.setpgid(child, child)
    signal.sigwait(signals)  # the child has ended, or is to end now
    os.killpg(child, signal.SIGKILL)
    status = os.waitstatus_to_exitcode(os.waitpid(child, 0)[1])
    if status == 1 or status == 0 and keep:
        subprocess.run(['chown', '-Rh', os.environ.get('SUDO_UID', '0'), place], check=True)
        print(f'The device is kept: {place}', file=sys.stderr)
    else:
        empty(place)
        os.rmdir(place)
    sys.exit(status)


def become_root():
    for way in [], ['unshare', '--map-root-user'], ['sudo']:
        python = [*way, sys.executable]
        chroot = [*python, '-c', 'import os; os.chroot("/")']
        if shutil.which(python[0]) and subprocess.run(chroot, capture_output=True).returncode == 0:
            return way and os.execvp(way[0], [*python, *sys.orig_argv[1:]])
    sys.exit('a device is entered by chroot, which takes root, a user namespace or sudo')


def empty(place):
    """Removes what is in the directory, unless something is mounted there."""
    with open('/proc/self/mountinfo') as mounts:
        points = re.sub(r'\\(\d+)', lambda code: chr(int(code[1], 8)), mounts.read())
    if f' {os.path.realpath(place)}/' in points:
        sys.exit(f'{place} is not emptied: something is mounted in it')
    entries = [entry.path for entry in os.scandir(place)]
    subprocess.run(['rm', '-rf', '--one-file-system', '--', *entries], check=True)


def enter(place, program, tools):
    """Furnishes the device with the program and the tools, and makes it the root directory."""
    global harness
    copies = {'/dev/null': '/dev/null', '/trace': '/dev/null', '/mira_tzlinks': program}
    copies |= {f'/{os.path.basename(tool)}': shutil.which(tool) for tool in tools}
    for path in [*copies.values()]:
        ldd = subprocess.run(['ldd', path], env={}, capture_output=True, text=True).stdout
        copies |= {path: path for path in re.findall(r'\t(?:\S+ => )?(/\S+) \(0x', ldd)}
    for name, path in copies.items():
        os.makedirs(os.path.dirname(place + name), exist_ok=True)
        shutil.copyfile(path, place + name)
        shutil.copymode(path, place + name)
    with open(program, 'rb') as file:
        if b'__asan_init' in file.read():  # AddressSanitizer reads /proc
            os.mkdir(f'{place}/proc')
            if ctypes.CDLL(None).unshare(0x20000) != 0:
                sys.exit('AddressSanitizer takes a mount namespace, which is refused here')
            for words in ['--make-rprivate', '/'], ['--rbind', '/proc', f'{place}/proc']:
                subprocess.run(['mount', *words], check=True)
    os.chroot(place)
    os.chdir('/')
    harness = {}
    harness = snapshot()
