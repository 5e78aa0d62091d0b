"""Makes build/demo a sample device, plays starts on it, and checks all that each changes."""

import pathlib
import re
import subprocess
import sys

sys.path.insert(0, 'tests')
from device import (BAD_LINKS, DATASETS, DEFAULT_ZONE, ENVIRONMENT, ICU, INCOMPATIBLE,  # noqa: E402
                    LATEST, LOCALTIME, MARKER, NOT_TAKEN, RECORD, SYSTEM_ICU, SYSTEM_ZONEINFO,
                    ZONEINFO, ZONE_RESET, Device, links_to, switch)

NOON = 'noon UTC by date(1)'


def facts():
    command = [*device.before_chroot, 'env', f'TZ=:{LOCALTIME}', *device.chroot, '/date',
               '-d', '@1736942400', '+%F %H:%M %z']
    date = subprocess.run(command, env=ENVIRONMENT, check=True, capture_output=True, text=True)
    return device.snapshot() | {NOON: date.stdout.strip()}


def start(title, warnings=(), changes={}, date=None, note=''):
    """Starts the program, prints what that did, and fails when it was something else."""
    print(f'\n{title}')
    before = facts()
    process = device.check_start(warnings, changes)
    after = facts()
    assert after[NOON] == (date or before[NOON]), after
    for line in (process.stderr.decode() + note).splitlines():
        print(f'   {line}')
    for path in ZONEINFO, ICU, LOCALTIME, MARKER, RECORD, NOON:
        was, now = before.get(path, 'none'), after.get(path, 'none')
        change = f'was {was}\n{23 * " "}now ' if now != was else 4 * ' '
        print(f'   {path.rpartition("/")[2]:19} {change}{now}')


def compile_tree(source, directory):
    zic = ['zic', '-d', device.outside(directory), '-']
    subprocess.run(zic, env=ENVIRONMENT, input=source.encode(), check=True)


source = pathlib.Path('/usr/share/zoneinfo/tzdata.zi').read_text()
first = (re.match('# version ([0-9]{4}[a-z]+)', source) or sys.exit('tzdata.zi has no version'))[1]
year = int(first[:4]) + 1
update = f'{DATASETS}/{year}a.1.0'
# The zone's last line holds until 2025; another follows, at -7 all year.
invented = re.sub(r'(?m)^Z America/Los_Angeles .*(\n-?\d.*)*', r'\g<0> 2025\n-7 - PDT', source)

device = Device('build', 'demo', ['build/release/mira_tzlinks'], ['date'])
device.put({f'{SYSTEM_ZONEINFO}/+VERSION': f'file {first}\n', DATASETS: 'directory',
            f'{SYSTEM_ICU}/icutzformat.txt': 'file 44l\n'})
compile_tree(source, SYSTEM_ZONEINFO)
start(f'1. The first start: the system partition has {first}, and there is no link yet.',
      ['Bad zoneinfo link ', BAD_LINKS, ZONE_RESET], links_to('system') | DEFAULT_ZONE,
      '2025-01-15 04:00 -0800',
      '(What follows the last colon is the last error of any system call; often it means nothing.)')

device.put({f'{update}/icutz/icutz44l.dat': 'file', LATEST: f'link {update}'})
compile_tree(invented, f'{update}/zoneinfo')
start(f'2. The update {year}a was installed: Los Angeles keeps summer time from 2025 on.', (),
      switch(f'{first}.1.0', f'{year}a.1.0'), '2025-01-15 05:00 -0700',
      '(This demo has invented the update and its summer time.)')

start('3. Nothing is new, as at every ordinary start after an update.', [NOT_TAKEN])

device.put({f'{SYSTEM_ZONEINFO}/+VERSION': f'file {year}b\n'})
start(f'4. The system partition was upgraded to {year}b, past the update, without summer time.',
      [INCOMPATIBLE, NOT_TAKEN], links_to('system') | {MARKER: 'file'}, '2025-01-15 04:00 -0800')

device.put({LATEST: None, update: None, LOCALTIME: 'link /usr/share/zoneinfo/Asia/Tokyo'})
start('5. Another program cleaned up the update, and linked local time past the zoneinfo link.',
      [f'Correcting localtime link to {ZONEINFO}/Asia/Tokyo'],
      {LOCALTIME: f'link {ZONEINFO}/Asia/Tokyo', MARKER: None}, '2025-01-15 21:00 +0900',
      '(Each start first deletes the marker. Without /usr/share/zoneinfo, the date was in UTC.)')

program = ' '.join([*device.before_chroot[1:], *device.chroot[:-1], 'build/demo'])
print(f'''
No start changed anything else. Try the program by hand, from the project's directory:
    ln -sfn /usr/share/zoneinfo/Asia/Tokyo build/demo{LOCALTIME}
    PATH=$PATH:/usr/sbin {program} /mira_tzlinks
    ls -l build/demo/var/db/timezone
Read next: the diagram in README.md, and doc/mira_tzlinks.8, the manual''')
