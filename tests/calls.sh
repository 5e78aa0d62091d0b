# shellcheck shell=bash disable=SC2154
# What a start asks of the system, in which order, and what becomes of a device when a call fails or
# the power is cut before it.
. /device.sh || exit

# traced COMMAND...: runs the command, which leaves its calls in the file "trace".
traced() { strace -qq -o trace "$@"; }

# The calls of the trace, from the first on the device on, each behind its name and its number among
# those of that name, as an injection wants them.
numbered() {
    awk '{ name = $0; sub(/\(.*/, "", name); number[name]++ }
        /"\/var\/db\/timezone\/"/ { begun = 1 }
        begun { print name, number[name], $0 }' trace
}

# The calls of a busy start on paths, its protection class and its warnings, and the files that are
# open at a warning or at the end. The names are those that all machines share.
busy_device
start 'a busy start' traced <<<"warning $incompatible"$'\n'"$told"$'\n'"$links"$'\n'"$files"
numbered >calls
names='open|unlink|symlink|readlink|access|stat|rename|rmdir|mkdir|chmod'
{
    sed -nE 's/^\w*('$names')\w* .*\((AT_FDCWD, )?"(\/[^"]*)"(, ([OF]_[A-Z_|]*))?.*/\1 \3 \5/
        /\/icutz\//d; s/ O_.*DIRECTORY.*//; s/\|O_LARGEFILE//; s/ $//
        s/.* 0x40 .*, (0x[0-9a-f]*)\) .*/protect \1/
        s/^write [0-9]+ write\(2, .*/warn/
        /^('$names'|protect|warn)( [/0]|$)/p' calls
    awk '/^open.* = [0-9]+$/ { open++ }
        /^pipe/ { open += 2 }
        /^close.* = 0/ { open-- }
        /write\(2,/ && open { print open " open" }
        END { if (open) print open " left open" }' calls
} >seen
read_system="open $system/+VERSION O_RDONLY, open /usr/share/icu/icutzformat.txt O_RDONLY"
sed 's/, /\n/g' >promised <<END
open $tz/ O_RDONLY|O_CLOEXEC, protect 0x4, open $tz/tz/ O_RDONLY|O_CLOEXEC, protect 0x4
unlink $tz/needs_cleanup, unlink /var/db/icu
$read_system, readlink $tz/tz_latest, readlink $tz/zoneinfo
open $tz/tz/2016e.1.0/zoneinfo/+VERSION O_RDONLY, stat $tz/tz/2016e.1.0/icutz
open $tz/tz/2016e.1.0/icutz, warn, $read_system
unlink $tz/zoneinfo, symlink $system, unlink /var/db/icutz
open $tz/needs_cleanup O_RDWR|O_CREAT
open $tz/tz/2016g.1.0/zoneinfo/+VERSION O_RDONLY, stat $tz/tz/2016g.1.0/icutz
open $tz/tz/2016g.1.0/icutz, unlink $tz/zoneinfo, symlink $tz/tz/2016g.1.0/zoneinfo
unlink /var/db/icutz, symlink $tz/tz/2016g.1.0/icutz
open $tz/TZVersionDiffRecord O_WRONLY|O_CREAT|O_TRUNC
readlink $tz/localtime, warn, access $tz/zoneinfo/No/Zone F_OK, warn
unlink $tz/localtime, symlink $default_zone
END
compare 'the calls of a busy start'

# A marker that cannot be examined or closed: the two calls after the one that opens it.
grep -A 2 'needs_cleanup.*O_CREAT' calls | sed 1d >marker_calls
while read -r call number _; do
    busy_device
    start "$call fails" traced -e inject="$call:error=EIO:when=$number" <<END
warning $incompatible
failed Cannot touch file $tz/needs_cleanup: Input/output error
$told
$links
$files
END
done <marker_calls

# Devices, by the current and the latest dataset. On each, every call on a path fails once: the
# start ends by itself, and the next one links usable data. And the power is cut before every call
# that changes something: what is lost is what the manual page tells under CAVEATS, here the place
# of the call and a fact that neither one nor two undisturbed starts leave so.
disturbed() { # INJECTION: starts the device as it was laid out, disturbed at a call, and once more
    rm -rf var usr/share && cp -a laid_out/. .
    ended=0
    traced -e inject="$call:$1:when=$number" /mira_tzlinks 2>errors || ended=$?
    /mira_tzlinks 2>later_errors || echo "the start after $line fails"
}
while read -r current latest; do
    usual_device
    link $tz/localtime /usr/share/zoneinfo
    [[ $current == system ]] || install_update "$current"
    [[ $latest == none ]] || { install_update "$latest" && link $tz/tz_latest "$tz/tz/$latest"; }
    make_current "$current"
    rm -rf laid_out && mkdir laid_out && cp -a --parents var usr/share laid_out
    traced /mira_tzlinks 2>errors
    numbered >calls
    facts >expected
    /mira_tzlinks 2>errors
    facts >>expected
    while read -r call number line; do
        place=$(sed -nE 's|.*"/([^"]*/)?([^"]*)".*|\2|p' <<<"$line")
        if [[ $line == *'"/'* ]]; then
            disturbed error=EIO
            ! grep -F '(-1' trace || echo "a call on no file after $line"
            [[ $ended -eq 0 ]] || echo "exit $ended by $line"
            # ICU data that cannot be read has no format; that is no failure.
            [[ $line != *DIRECTORY* ]] || grep -F "$no_data" errors || :
            [[ -d $tz/zoneinfo && $(readlink $tz/zoneinfo) != *2016e* &&
                $(readlink $tz/localtime) == $zones* ]] || echo "not usable after $line"
        fi
        if [[ $line =~ unlink|symlink|O_CREAT|write.*\"20 ]]; then
            disturbed signal=KILL
            [[ $ended -eq 137 ]] || echo "exit $ended before $line"
            facts | grep -Fxv -f expected | sed "s/^/${place:-content}: /" || :
        fi
    done <calls
done >lost <<END
system     2016g.1.0
2016f.1.1  2016g.1.0
2016e.1.0  2016g.1.0
2016e.1.0  none
system     none
END
sort -u lost >seen
sed 's/, /\n/g' >promised <<END
TZVersionDiffRecord: record    none, content: record    touched
icutz: icutz     $tz/tz/2016e.1.0/icutz, icutz: icutz     $tz/tz/2016f.1.1/icutz
icutz: icutz     none, icutz: record    none
localtime: localtime $default_zone
needs_cleanup: record    none, zoneinfo: record    2016f.1.0_2016g.1.0
END
compare 'a call fails, or the power is cut'
