"""demo.py PROGRAM DIRECTORY [colours]: makes the directory a sample device, plays six starts of it,
and checks after each that the program did what it promises."""

import os
import pathlib
import re
import subprocess
import sys
import time

sys.path.insert(0, 'tests')
import device  # noqa: E402
from device import DATASETS, LATEST, LOCALTIME, MARKER, RESET_ZONE, SYSTEM, ZONEINFO  # noqa: E402

PROGRAM, PLACE = sys.argv[1:3]
BOLD, GREEN, PLAIN = ['\33[1m', '\33[32m', '\33[m'] if sys.argv[3:] else 3 * ['']
FACTS = {
    'zoneinfo': (ZONEINFO, 'the link to the tz database in use'),
    'icutz': (device.ICU, "the link to an update's ICU data"),
    'localtime': (LOCALTIME, 'the link to the local time zone, through the first'),
    'marker': (MARKER, 'touched when an update is given up, for other programs to clean up'),
    'record': (device.RECORD, 'the versions before and after the last switch to an update'),
    'date': (None, 'noon in London on 15 January 2025, as others read it through the links'),
}
starts = []


def facts():
    for os.environ['TZ'] in 'UTC', f':{LOCALTIME}':  # a TZ that stays is not read again
        time.tzset()
    seen = device.snapshot() | {None: time.strftime('date %F %H:%M %z', time.localtime(1736942400))}
    return {name: seen.get(path, ' none').removesuffix(' *').partition(' ')[2] or 'touched'
            for name, (path, _) in FACTS.items()}


def run(*arguments, run=device.run, **options):
    starts.append(run(*arguments, **options))
    return starts[-1]


def start(title, warnings=(), changes={}, date=None, note=''):
    """Starts the device, prints what that did, and fails when it was something else."""
    print(f'\n{BOLD}{len(starts) + 1}. {title}{PLAIN}', flush=True)
    before = facts()
    device.start(warnings, changes)
    after = facts()
    device.compare([f'date {date or before["date"]}'], [f'date {after["date"]}'])
    for line in (os.fsdecode(starts[-1].stderr) + note).splitlines():
        print(f'   {line}')
    for name, (_, meaning) in FACTS.items():
        was = 4 * ' ' if after[name] == before[name] else f'was {before[name]}\n{13 * " "}now '
        print(f'   {name:9} {was}{after[name]}' + f'\n{17 * " "}({meaning})' * (len(starts) == 1))
    print(f'   {GREEN}as promised{PLAIN}')


def compile_tree(source, directory):
    subprocess.run(['/zic', '-d', directory, '-'], input=source, text=True, check=True)


def next_version(version):
    return f'{version}a' if version[-1] == 'z' else version[:-1] + chr(ord(version[-1]) + 1)


def story():
    device.run = run
    update, upgrade, error = next_version(first), next_version(next_version(first)), os.strerror(2)
    dataset = f'{DATASETS}/{update}.1.0'
    # The zone's last line ends with 2024; another follows.
    zone = r'(?m)^Z America/Los_Angeles .*(\n-?\d.*)*'
    invented = re.sub(zone, r'\g<0> 2025\n-7 - PDT', source, count=1)

    compile_tree(source, SYSTEM)
    device.put({f'{SYSTEM}/+VERSION': f'file {first}\n', DATASETS: 'directory',
                f'{device.SYSTEM_ICU}/icutzformat.txt': 'file 44l\n'})
    start(f'The first start: the system partition has {first}, and there is no link yet.',
          [f'bad_link=: {error}', f'bad_links: {error}', f'reset_zone: {error}'],
          {ZONEINFO: f"link {SYSTEM}"} | RESET_ZONE, '2025-01-15 04:00 -0800')

    compile_tree(invented, f'{dataset}/zoneinfo')
    device.put({f'{dataset}/icutz/icutz44l.dat': 'file', LATEST: f'link {dataset}'})
    start(f'The update {update} was installed: Los Angeles keeps summer time from 2025 on.', (),
          device.switched(f'{first}.1.0', f'{update}.1.0'), '2025-01-15 05:00 -0700',
          '(This demo has invented the update and its summer time.)')

    start('Nothing is new.', ['not_taken'], note='''\
(Every ordinary start after an update looks like this and prints this warning. What follows
the last colon is the last error of any system call: here it means nothing.)''')

    compile_tree(invented, SYSTEM)
    device.put({f'{SYSTEM}/+VERSION': f'file {upgrade}\n'})
    start(f'The system partition was upgraded to {upgrade}, past the update.',
          ['incompatible', 'not_taken'], device.data_links('system') | {MARKER: 'file'})

    device.put({LATEST: None, dataset: None, LOCALTIME: 'link /usr/share/zoneinfo/Asia/Tokyo'})
    changes = {LOCALTIME: f'link {ZONEINFO}/Asia/Tokyo', MARKER: None}
    start('The old update was cleaned up, and local time was linked past the zoneinfo link.',
          [f'correcting={ZONEINFO}/Asia/Tokyo'], changes, '2025-01-15 21:00 +0900')

    device.put({LOCALTIME: 'link nowhere'})
    start('The local-time link was broken.', ['reset_zone'], RESET_ZONE,
          '2025-01-15 05:00 -0700')

    for parent, own in ('/', 'mira_tzlinks usr var'), ('/usr', 'share'), ('/var', 'db'):
        for name in set(os.listdir(parent)) - set(own.split()):
            device.put({os.path.join(parent, name): None})
    for path in device.snapshot():
        os.utime(path, follow_symlinks=False)
    print(f'''
Look at the device, change something, and play the next start by hand, from the project's directory:
    ls -l {PLACE}/var/db/timezone
    ln -sfn /usr/share/zoneinfo/Asia/Tokyo {PLACE}{LOCALTIME}
    {chroot}{PLACE} /mira_tzlinks
Read next: the diagram in README.md of what a start decides, and man doc/mira_tzlinks.8''')
    return True


source = pathlib.Path('/usr/share/zoneinfo/tzdata.zi').read_text()
first = (re.match('# version ([0-9]+[a-z]+)', source) or sys.exit('tzdata.zi has no version'))[1]
chroot = 'sudo chroot ' if 'SUDO_UID' in os.environ else 'chroot '
if os.stat('/').st_uid:  # root of a user's own namespace does not own it
    chroot = 'unshare --map-root-user --root='
device.in_device(story, PROGRAM, PLACE, ['zic'], keep=True)
