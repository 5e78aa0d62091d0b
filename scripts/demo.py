"""Makes build/demo a sample device, plays six starts of it, and checks after each that the program
changed what it should and nothing else."""

import os
import pathlib
import re
import subprocess
import sys
import time

sys.path.insert(0, 'tests')
import device  # noqa: E402
from device import DATASETS, LATEST, LOCALTIME, MARKER, RESET_ZONE, SYSTEM, ZONEINFO  # noqa: E402

PLACE = 'build/demo'
FACTS = {
    'zoneinfo': (ZONEINFO, 'the link to the tz database in use'),
    'icutz': (device.ICU, "the link to an update's ICU data"),
    'localtime': (LOCALTIME, 'the link to the local time zone, through the first'),
    'marker': (MARKER, 'touched when an update is given up, for other programs to clean up'),
    'record': (device.RECORD, 'the versions before and after the last switch to an update'),
    'date': ('date', 'noon in London on 15 January 2025, as others read it through the links'),
}


def facts():
    for os.environ['TZ'] in 'UTC', f':{LOCALTIME}':  # a TZ that stays is not read again
        time.tzset()
    date = time.strftime('date %F %H:%M %z', time.localtime(1736942400))
    seen = device.snapshot() | {'date': date}
    return {name: seen.get(path, ' none').removesuffix(' *').partition(' ')[2] or 'touched'
            for name, (path, _) in FACTS.items()}


def start(title, warnings=(), changes={}, date=None, note=''):
    """Starts the device, prints what that did, and fails when it was something else."""
    print(f'\n{title}')
    before = facts()
    process = device.start(warnings, changes)
    after = facts()
    device.compare([f'date {date or before["date"]}'], [f'date {after["date"]}'])
    for line in (os.fsdecode(process.stderr) + note).splitlines():
        print(f'   {line}')
    for name, (_, meaning) in FACTS.items():
        was = 4 * ' ' if after[name] == before[name] else f'was {before[name]}\n{13 * " "}now '
        print(f'   {name:9} {was}{after[name]}')
        if title.startswith('1.'):
            print(f'{17 * " "}({meaning})')
    print('   as promised')


def compile_tree(source, directory):
    subprocess.run(['/zic', '-d', directory, '-'], input=source, text=True, check=True)


def story():
    error = os.strerror(2)
    compile_tree(source, SYSTEM)
    device.put({f'{SYSTEM}/+VERSION': f'file {first}\n', DATASETS: 'directory',
                f'{device.SYSTEM_ICU}/icutzformat.txt': 'file 44l\n'})
    start(f'1. The first start: the system partition has {first}, and there is no link yet.',
          [f'bad_link=: {error}', f'bad_links: {error}', f'reset_zone: {error}'],
          {ZONEINFO: f'link {SYSTEM}'} | RESET_ZONE, '2025-01-15 04:00 -0800')

    compile_tree(invented, f'{dataset}/zoneinfo')
    device.put({f'{dataset}/icutz/icutz44l.dat': 'file', LATEST: f'link {dataset}'})
    start(f'2. The update {year}a was installed: Los Angeles keeps summer time from 2025 on.', (),
          device.data_links(f'{year}a.1.0', f'{first}.1.0'), '2025-01-15 05:00 -0700',
          '(This demo has invented the update and its summer time.)')

    start('3. Nothing is new.', ['not_taken'], note='''\
(Every ordinary start after an update looks like this and prints this warning. What follows
the last colon is the last error of any system call: here it means nothing.)''')

    compile_tree(invented, SYSTEM)
    device.put({f'{SYSTEM}/+VERSION': f'file {year}b\n'})
    start(f'4. The system partition was upgraded to {year}b, past the update.',
          ['incompatible', 'not_taken'], device.data_links('system') | {MARKER: 'file'})

    device.put({LATEST: None, dataset: None, LOCALTIME: 'link /usr/share/zoneinfo/Asia/Tokyo'})
    start('5. Another program cleaned up the update, and linked local time past the zoneinfo link.',
          [f'correcting={ZONEINFO}/Asia/Tokyo'],
          {LOCALTIME: f'link {ZONEINFO}/Asia/Tokyo', MARKER: None}, '2025-01-15 21:00 +0900',
          '(The device has no /usr/share/zoneinfo, so that its date was in UTC.)')

    device.put({LOCALTIME: 'link /no/such/zone'})
    start('6. The local-time link was broken.', ['reset_zone'], RESET_ZONE,
          '2025-01-15 05:00 -0700')

    # What stays is the device alone, with the times of today.
    for name in set(os.listdir('/')) - {'mira_tzlinks', 'usr', 'var'}:
        device.put({f'/{name}': None})
    for path in device.snapshot():
        os.utime(path, follow_symlinks=False)
    print(f'''
Look at the device, change something, and play the next start by hand, from the project's directory:
    ln -sfn /usr/share/zoneinfo/Asia/Tokyo {PLACE}{LOCALTIME}
    {chroot}{PLACE} /mira_tzlinks
    ls -l {PLACE}/var/db/timezone
Read next: the diagram in README.md of what a start decides, and man doc/mira_tzlinks.8''')
    return True


source = pathlib.Path('/usr/share/zoneinfo/tzdata.zi').read_text()
first = (re.match('# version ([0-9]{4}[a-z]+)', source) or sys.exit('tzdata.zi has no version'))[1]
year = int(first[:4]) + 1
dataset = f'{DATASETS}/{year}a.1.0'
# The zone's last line ends with 2024; another follows.
invented = re.sub(r'(?m)^Z America/Los_Angeles .*(\n-?\d.*)*', r'\g<0> 2025\n-7 - PDT', source)
chroot = 'sudo chroot ' if 'SUDO_UID' in os.environ else 'chroot '
if os.stat('/').st_uid:  # the machine's, which root of a user's own namespace does not own
    chroot = 'unshare --map-root-user --root='
device.in_device(story, 'build/release/mira_tzlinks', PLACE, ['zic'], keep=True)
