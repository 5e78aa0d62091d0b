"""A device, and the words to lay one out, start it, and compare what happened with what should have.

A device is a directory with the program in it. A process of ours enters it by chroot: the system's
paths are paths in there, and nothing that a test does can reach what lies outside.
"""

import __main__
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
LOCALTIME, DEFAULT_ZONE = f'{TZ}/localtime', f'{ZONEINFO}/America/Los_Angeles'
MARKER, RECORD = f'{TZ}/needs_cleanup', f'{TZ}/TZVersionDiffRecord'
LONG = '/' + 1023 * 'x'  # as much as is read of a link

# The words for warnings. What follows a word and `=` takes the place of the braces.
WARNINGS = {
    'bad_link': 'Bad zoneinfo link {}',
    'bad_links': 'Invalid current symlinks; resetting to system partition',
    'bad_path': 'mira_dataset::create_components: bad path {}',
    'correcting': 'Correcting localtime link to {}',
    'incompatible': 'Symlink points at data incompatible with installed system',
    'no_data': 'Unable to locate data; resetting to system partition',
    'not_taken': 'New update not compatible or older version',
    'reset_zone': 'localtime link invalid; resetting to America/Los_Angeles',
    'unparsed': 'Cannot parse version string {0}, results.size() = 0\nCannot parse version string {0}',
    'unreadable': 'read_symlink: {}: Invalid argument',
}
# Every start has these and must not heed them.
ARGUMENTS = ['--version', '-x', '/elsewhere']
VARIABLES = 'DEBUG DESTDIR HOME ICU_DATA ICU_TIMEZONE_FILES_DIR LANG LC_ALL PATH PWD ROOT TMPDIR TZ TZDIR'
ENVIRONMENT = {**dict.fromkeys(VARIABLES.split(), '/elsewhere'), 'ASAN_OPTIONS': 'detect_leaks=0'}

WORDS = {'system': f'link {SYSTEM}', 'file': 'file', 'directory': 'directory', 'none': None}
KINDS = {'-rw-r--r--': 'file', 'drwxr-xr-x': 'directory', 'lrwxrwxrwx': 'link'}
OLD = 2208988800, 2**31 - 1  # 2040, and what that is on a file system whose dates end before
command = ['/mira_tzlinks']
harness = None  # in a device, a snapshot of what it holds for our sake


def put(path, what=None):
    """Puts at the path, in place of what is there, what a snapshot shows so; by None nothing."""
    if harness is None:
        sys.exit('this is no device')
    shutil.rmtree(path, ignore_errors=True)
    if os.path.lexists(path):
        os.remove(path)
    os.makedirs(os.path.dirname(path), exist_ok=True)
    kind, _, content = (what or '').partition(' ')
    if kind == 'link':
        os.symlink(content, path)
    elif kind == 'directory':
        os.mkdir(path)
    elif kind == 'file':
        with open(path, 'wb') as file:
            file.write(os.fsencode(content))


def snapshot():
    """Returns, by path, what is on the device: `link TEXT`, `file CONTENT` or `directory`, with the
    mode for the word where it is not the usual one, and ` *` behind it unless its time is OLD."""
    seen = {}
    for parent, directories, files in os.walk('/'):
        directories[:] = [name for name in directories if name != 'proc']
        for path in {os.path.join(parent, name) for name in directories + files} - harness.keys():
            status = os.lstat(path)
            mode, content = stat.filemode(status.st_mode), ''
            if mode[0] == 'l':
                content = f' {os.readlink(path)}'
            elif mode[0] == '-' and status.st_size:
                with open(path, 'rb') as file:
                    content = f' {os.fsdecode(file.read())}'
            seen[path] = KINDS.get(mode, mode) + content + ' *' * (int(status.st_mtime) not in OLD)
    return seen


def install_system(version, icu_format='44l'):
    """Installs the system dataset, with a file that would be data in an update."""
    put(f'{SYSTEM}/+VERSION', f'file {version}\n')
    put(f'{SYSTEM}/Asia/Tokyo', 'file')
    put(f'{SYSTEM_ICU}/icutzformat.txt', f'file {icu_format}\n')
    put(f'{SYSTEM_ICU}/icutz77e.dat', 'file')


def install_update(version):
    """Installs an update, with texts that would count in the system dataset; some have other formats."""
    icu_format = {'2017': '48l', '2018': '44b'}.get(version[:4], '44l')
    put(f'{DATASETS}/{version}/zoneinfo/+VERSION', 'file 1999z\n')
    put(f'{DATASETS}/{version}/icutz/icutz{icu_format}.dat', 'file')
    put(f'{DATASETS}/{version}/icutz/icutzformat.txt', 'file 77e\n')


def data_links(version):
    """Returns, by path, the data links while a version, or "system", is current."""
    if version == 'system':
        return {ZONEINFO: f'link {SYSTEM}', ICU: None}
    return {path: f'link {DATASETS}/{version}/{os.path.basename(path)}' for path in (ZONEINFO, ICU)}


def switched(current, latest):
    """Returns, by path, what a switch from one version to another changes."""
    return data_links(latest) | {RECORD: f'file {current}_{latest}'}


def lay_out(current='system', latest='none', localtime=f'{ZONEINFO}/Asia/Tokyo', system='2016f'):
    """Makes the device anew. The zoneinfo, the latest and the local-time link have a text that begins
    with a slash or a dot, are one of WORDS, or lead to an update of a version."""
    put('/usr/share')
    put('/var')
    put(DATASETS, 'directory')
    install_system(system)
    links = {ZONEINFO: current, LATEST: latest, LOCALTIME: localtime, ICU: './stale'}
    links = {path: WORDS.get(text, f'link {text}') for path, text in links.items()}
    versions = [text for text in (current, latest) if text not in WORDS and text[0] not in './']
    for version in versions:
        install_update(version)
    if latest in versions:
        links[LATEST] = f'link {DATASETS}/{latest}'
    for path, what in (links | (data_links(current) if current in versions else {})).items():
        put(path, what)


def lay_out_busy():
    """Lays out a device whose next start changes all it can; returns its warnings and changes."""
    lay_out('2016e.1.0', '2016g.1.0', '/usr/share/zoneinfo/No/Zone')
    changes = {LOCALTIME: f'link {DEFAULT_ZONE}', MARKER: 'file', **switched('2016f.1.0', '2016g.1.0')}
    error = 'No such file or directory'
    return ['incompatible', f'correcting={ZONEINFO}/No/Zone', f'reset_zone: {error}'], changes


def run(*before, prepare=None):
    """Runs the program to its end, behind the words of another command and after a call of `prepare`
    in its process; returns it with its output and status."""
    process = subprocess.run([*before, *command, *ARGUMENTS], env=ENVIRONMENT, preexec_fn=prepare,
                             stdin=subprocess.DEVNULL, capture_output=True, timeout=20)
    if b'PTRACE' in process.stderr:
        sys.exit(f'system calls cannot be traced here: {os.fsdecode(process.stderr)}')
    return process


def start(warnings=(), changes={}, status=0, before=(), prepare=None):
    """Runs the program and checks its warnings, its exit status, and all that it changes, by path. A
    warning has `: ERROR` where a call has just failed, and elsewhere is taken with any error."""
    for path in snapshot():
        os.utime(path, (OLD[0], OLD[0]), follow_symlinks=False)
    expected = snapshot()
    process = run(*before, prepare=prepare)
    seen = snapshot()
    for path, what in changes.items():
        parent = os.path.dirname(path)
        expected |= {parent: expected[parent].removesuffix(' *') + ' *', path: what and f'{what} *'}
    expected = {path: what for path, what in expected.items() if what}
    texts = []
    for warning in warnings:
        word, colon, error = warning.partition(': ')
        name, _, argument = word.partition('=')
        text = WARNINGS.get(name, word).format(argument) + colon + error
        texts += [f'mira_tzlinks: {line}' for line in re.split('\n(?=Cannot)', text)]
    lines = re.split(r'\n(?=mira_tzlinks: |\Z)', os.fsdecode(process.stdout + process.stderr))
    lines = [line if line in texts else re.sub(': [A-Z][^:]*$', '', line) for line in lines]
    compare([*texts, '', f'exit status {status}', *difference(expected, seen)],
            [*lines, f'exit status {process.returncode}', *difference(seen, expected)])


def difference(tree, other):
    return sorted(f'{path}: {what}' for path, what in tree.items() - other.items())


def compare(expected, seen):
    """Ends this process and shows both lists of lines, unless they are the same."""
    if expected != seen:
        signs = {'-': '  expected ', '+': '  seen     ', ' ': '           '}
        lines = [*difflib.unified_diff(expected, seen, n=99, lineterm='')][3:]
        sys.exit('\n'.join(signs[line[0]] + line[1:300] for line in lines))


def main(*tools):
    """Runs the tests of a script in a device beside PROGRAM: functions named test_..., or calls of one
    with the cells of each row of the table in its text; those that have every WORD in their titles."""
    if len(sys.argv) == 1:
        sys.exit(f'usage: {sys.argv[0]} [EMULATOR;]PROGRAM [WORD...]')
    *emulator, program = sys.argv[1].split(';')
    command[:0] = [f'/{os.path.basename(path)}' for path in emulator]
    tests = []
    for name, function in vars(__main__).items():
        if name.startswith('test_'):
            text, _, table = (function.__doc__ or '').partition('\n\n')
            first = function.__code__.co_firstlineno + text.count('\n') + 3
            rows = [*enumerate(table.splitlines(), first)][1:-1] or [(first - 3, '')]
            tests += [(line, f'{name} {row}', function, row) for line, row in rows]
    tests = [test for test in tests if all(word in test[1] for word in sys.argv[2:])]

    def run_tests():
        for line, title, function, row in tests:
            try:
                function(*row.partition('#')[0].format(**globals()).split())
            except BaseException:
                print(f'{sys.argv[0]}:{line}: {title}', file=sys.stderr)
                raise
        print(f'{len(tests)} passed')
        return tests

    script = os.path.basename(sys.argv[0]).removesuffix('.py')
    in_device(run_tests, program, f'{os.path.dirname(program)}/device.{script}', [*emulator, *tools])


def in_device(action, program, place, tools=(), keep=False):
    """Makes the directory `place` a device with the program and the tools, calls `action` in it, and
    ends this process, with 0 when that returned true. Removes the device unless the action failed or
    `keep` is true. Another user becomes root for that, in a user namespace or by sudo."""
    become_root()
    signals = signal.SIGINT, signal.SIGTERM, signal.SIGHUP, signal.SIGCHLD
    signal.pthread_sigmask(signal.SIG_BLOCK, signals[:3])
    ctypes.CDLL(None).prctl(1, signal.SIGTERM)  # once our own parent has ended
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
    if status == (0 if keep else 1):
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
    """Furnishes the device with the program, the tools and what they need, and makes it the root."""
    global harness
    copies = {path: path for path in map(os.path.abspath, (sys.argv[0], __file__))}  # for a traceback
    for name, path in {'mira_tzlinks': program, **{tool: shutil.which(tool) for tool in tools}}.items():
        if not path or not os.path.isfile(path):
            sys.exit(f'there is no {path or name}')
        ldd = subprocess.run(['ldd', path], capture_output=True, text=True).stdout
        copies |= {path: path for path in re.findall(r'\t(?:\S+ => )?(/\S+) \(0x', ldd)}
        copies[f'/{os.path.basename(name)}'] = path
    for name, path in (copies | {'/dev/null': '/dev/null', '/trace': '/dev/null'}).items():
        os.makedirs(os.path.dirname(place + name), exist_ok=True)
        shutil.copyfile(path, place + name)
        shutil.copymode(path, place + name)
    with open(program, 'rb') as file:
        if b'__asan_init' in file.read():  # AddressSanitizer reads /proc
            show_proc(place)
    os.chroot(place)
    os.chdir('/')
    harness = {}
    harness = snapshot()


def show_proc(place):
    """Mounts /proc in the device, in a mount namespace of this process."""
    if ctypes.CDLL(None).unshare(0x20000) != 0:
        sys.exit('AddressSanitizer reads /proc, which takes a mount namespace')
    os.mkdir(f'{place}/proc')
    for words in ['--make-rprivate', '/'], ['--rbind', '/proc', f'{place}/proc']:
        subprocess.run(['mount', *words], check=True)
