"""A device, and the words to lay one out, start it, and compare what happened with what should have.

A device is a directory with the program in it. A process of ours enters it by chroot: the system's
paths are paths in there, and nothing that a test does can reach what lies outside.
"""

import __main__
import ctypes
import difflib
import fcntl
import os
import pathlib
import re
import select
import shutil
import signal
import stat
import subprocess
import sys

TZ = '/var/db/timezone'
DATASETS = f'{TZ}/tz'
LATEST = f'{TZ}/tz_latest'
ZONEINFO = f'{TZ}/zoneinfo'
ICU = '/var/db/icutz'
LOCALTIME = f'{TZ}/localtime'
DEFAULT_ZONE = f'{ZONEINFO}/America/Los_Angeles'
MARKER = f'{TZ}/needs_cleanup'
RECORD = f'{TZ}/TZVersionDiffRecord'
SYSTEM = '/usr/share/zoneinfo.default'
SYSTEM_ICU = '/usr/share/icu'
LONG = '/' + 1023 * 'x'  # all that is read of a link that is longer

# The words for warnings. `bad_link=TEXT` has TEXT in place of the braces.
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

# No start may heed these; only a sanitizer does.
ARGUMENTS = ['--version', '-x', '/elsewhere']
ENVIRONMENT = dict.fromkeys(
    'DEBUG DESTDIR HOME ICU_DATA ICU_TIMEZONE_FILES_DIR LANG LC_ALL PATH PREFIX PWD ROOT TMPDIR TZ '
    'TZDIR TZPATH USER VERBOSE ZONEINFO'.split(), '/elsewhere') | {'ASAN_OPTIONS': 'detect_leaks=0'}

KINDS = {'-rw-r--r--': 'file', 'drwxr-xr-x': 'directory', 'lrwxrwxrwx': 'link'}
OLD = 2208988800, 2**31 - 1  # 2040, and what that is on a file system whose dates end before
command = ['/mira_tzlinks']
harness = None  # in a device, the snapshot of what it holds for our sake


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
        pathlib.Path(path).write_bytes(os.fsencode(content))


def snapshot():
    """Returns, by path, all that is on the device: `link TEXT`, `file CONTENT` or `directory`, or its
    mode in place of that word where it is another than usual; ` *` follows unless the time is OLD."""
    seen = {}
    for parent, directories, files in os.walk('/'):
        directories[:] = [name for name in directories if name != 'proc']
        for path in {os.path.join(parent, name) for name in directories + files} - harness.keys():
            status = os.lstat(path)
            mode, content = stat.filemode(status.st_mode), ''
            if mode[0] == 'l':
                content = f' {os.readlink(path)}'
            elif mode[0] == '-' and status.st_size:
                content = f' {os.fsdecode(pathlib.Path(path).read_bytes())}'
            seen[path] = KINDS.get(mode, mode) + content + ' *' * (int(status.st_mtime) not in OLD)
    return seen


def install_system(version, icu_format='44l'):
    """Installs the system dataset, with a file that would be data in an updated one."""
    put(f'{SYSTEM}/+VERSION', f'file {version}\n')
    put(f'{SYSTEM}/Asia/Tokyo', 'file')
    put(f'{SYSTEM_ICU}/icutzformat.txt', f'file {icu_format}\n')
    put(f'{SYSTEM_ICU}/icutz77e.dat', 'file')


def install_update(version):
    """Installs an updated dataset, with files that would count in that of the system."""
    icu_format = {'2017': '48l', '2018': '44b'}.get(version[:4], '44l')
    put(f'{DATASETS}/{version}/zoneinfo/+VERSION', 'file 1999z\n')
    put(f'{DATASETS}/{version}/icutz/icutz{icu_format}.dat', 'file')
    put(f'{DATASETS}/{version}/icutz/icutzformat.txt', 'file 77e\n')


def data_links(version):
    """Returns, by path, the data links to an updated dataset or to that of the "system"."""
    if version == 'system':
        return {ZONEINFO: f'link {SYSTEM}', ICU: None}
    return {path: f'link {DATASETS}/{version}/{os.path.basename(path)}' for path in (ZONEINFO, ICU)}


def switched(current, latest):
    """Returns, by path, what a start changes that switches to the latest dataset."""
    return data_links(latest) | {RECORD: f'file {current}_{latest}'}


def lay_out(current='system', latest=None, localtime=f'{ZONEINFO}/Asia/Tokyo', system='2016f'):
    """Makes the device anew: the system dataset of a version, two updates, and the links."""
    for path in '/usr/share', '/var':
        put(path)
    put(DATASETS, 'directory')
    install_system(system)
    for version in {current, latest} - {'system', None}:
        install_update(version)
    links = {LATEST: latest and f'link {DATASETS}/{latest}', LOCALTIME: f'link {localtime}'}
    for path, what in (data_links(current) | links).items():
        put(path, what)


def lay_out_busy():
    """Lays out a device whose next start changes all it can; returns its warnings and changes."""
    lay_out('2016e.1.0', '2016g.1.0', '/usr/share/zoneinfo/No/Zone')
    changes = {LOCALTIME: f'link {DEFAULT_ZONE}', MARKER: 'file', **switched('2016f.1.0', '2016g.1.0')}
    error = 'No such file or directory'
    return ['incompatible', f'correcting={ZONEINFO}/No/Zone', f'reset_zone: {error}'], changes


def run(*before, prepare=None):
    """Runs the program, behind another command if there is one and after a call of `prepare` in its
    process; returns it with what it has printed and its status."""
    process = subprocess.run([*before, *command, *ARGUMENTS], env=ENVIRONMENT, preexec_fn=prepare,
                             stdin=subprocess.DEVNULL, capture_output=True, timeout=20)
    if b'PTRACE' in process.stderr:
        sys.exit(f'system calls cannot be traced here: {os.fsdecode(process.stderr)}')
    return process


def start(warnings=(), changes={}, status=0, before=(), prepare=None):
    """Runs the program and checks its warnings, what it changes on the device, and its exit status.

    A warning is a word or a text, with `: ERROR` where a call has just failed and without the error
    that follows elsewhere. Everything on the device has to stay, its time included, but for
    `changes`, by path. A difference is printed and ends this process.
    """
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
        lines = list(difflib.unified_diff(expected, seen, n=99, lineterm=''))[3:]
        sys.exit('\n'.join(signs[line[0]] + line[1:300] for line in lines))


def rows(table):
    """Makes each row of the table a test: a call of the function with the row's cells. The first row
    names the columns, and braces hold a name of this file."""
    line = sys._getframe(1).f_lineno

    def add(function):
        function.rows = [*enumerate(table.splitlines(), line)][2:]
        return function

    return add


def main(*tools):
    """Runs the functions of a script named test_... and their rows, in a device beside PROGRAM: those
    with every WORD in their titles. `EMULATOR;PROGRAM` runs that of another processor."""
    if len(sys.argv) == 1:
        sys.exit(f'usage: {sys.argv[0]} PROGRAM [WORD...]')
    *emulator, program = sys.argv[1].split(';')
    command[:0] = [f'/{os.path.basename(path)}' for path in emulator]


    def run_tests():
        passed = 0
        for name, function in [*vars(__main__).items()]:
            if not name.startswith('test_'):
                continue
            for line, row in getattr(function, 'rows', [(function.__code__.co_firstlineno, '')]):
                if all(word in f'{name} {row}' for word in sys.argv[2:]):
                    try:
                        function(*row.format(**globals()).split())
                    except BaseException:
                        print(f'{sys.argv[0]}:{line}: {name} {row}', file=sys.stderr)
                        raise
                    passed += 1
        print(f'{passed} passed')
        return passed > 0

    script = os.path.basename(sys.argv[0]).removesuffix('.py')
    in_device(run_tests, program, f'{os.path.dirname(program)}/device.{script}', [*emulator, *tools])


def in_device(action, program, place, tools=(), keep=False):
    """Makes the directory `place` a device with the program and the tools, calls `action` in it, and
    ends this process, with 0 when that has returned true. The device is removed unless the action
    has failed or `keep` is true. Another user becomes root first, in a user namespace or by sudo."""
    become_root()
    os.umask(0o022)
    os.makedirs(place, exist_ok=True)
    lock = os.open(place, os.O_DIRECTORY | os.O_NOFOLLOW)
    fcntl.flock(lock, fcntl.LOCK_EX)  # waits for another run
    empty(place)
    child = os.fork()
    if child == 0:
        enter(place, program, tools)
        sys.exit(not action())
    os.setpgid(child, child)
    signals = signal.SIGINT, signal.SIGTERM, signal.SIGHUP
    try:
        for number in signals:
            signal.signal(number, lambda *_: sys.exit(128))
        ended = select.poll()
        ended.register(os.pidfd_open(child), select.POLLIN)
        ended.register(1, 0)  # that of the reader of what is printed
        ended.poll()
    finally:
        for number in signals:
            signal.signal(number, signal.SIG_IGN)
        os.killpg(child, signal.SIGKILL)
        status = os.waitstatus_to_exitcode(os.waitpid(child, 0)[1])
        if status == (0 if keep else 1):
            subprocess.run(['chown', '-Rh', os.environ.get('SUDO_UID', '0'), place], check=True)
            print(f'The device is kept: {place}')
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
    mounts = pathlib.Path('/proc/self/mountinfo').read_text()
    points = re.sub(r'\\(\d+)', lambda code: chr(int(code[1], 8)), mounts)
    if f' {os.path.realpath(place)}/' in points:
        sys.exit(f'{place} is not emptied: something is mounted in it')
    subprocess.run(['rm', '-rf', '--one-file-system', *pathlib.Path(place).glob('*')], check=True)


def enter(place, program, tools):
    """Furnishes the device with the program, the tools and what they need, and makes it the root."""
    global harness
    copies = {os.path.abspath(path): path for path in (sys.argv[0], __file__)}  # for a traceback
    for name, path in {'mira_tzlinks': program, **{tool: shutil.which(tool) for tool in tools}}.items():
        if not path or not os.path.isfile(path):
            sys.exit(f'there is no {path or name}')
        ldd = subprocess.run(['ldd', path], capture_output=True, text=True).stdout
        copies |= {path: path for path in re.findall(r'^\t(?:\S+ => )?(/\S+) \(0x', ldd, re.MULTILINE)}
        copies[f'/{os.path.basename(name)}'] = path
    for name, path in copies.items():
        os.makedirs(os.path.dirname(place + name), exist_ok=True)
        shutil.copy(path, place + name)
    for name in '/dev/null', '/trace', '/proc/none':
        os.makedirs(os.path.dirname(place + name), exist_ok=True)
        open(place + name, 'w').close()
    if b'__asan_init' in pathlib.Path(program).read_bytes():  # AddressSanitizer reads /proc
        if ctypes.CDLL(None).unshare(0x20000):
            sys.exit('AddressSanitizer reads /proc, which takes a mount namespace here')
        for words in ['--make-rprivate', '/'], ['--rbind', '/proc', f'{place}/proc']:
            subprocess.run(['mount', *words], check=True)
    os.chroot(place)
    os.chdir('/')
    harness = {}
    harness = snapshot()
