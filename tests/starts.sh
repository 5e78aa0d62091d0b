# shellcheck shell=bash disable=SC2154,SC2086
# What a start finds, and what it makes of it.
. /device.sh || exit

# tell NAME...: the warnings of a row of a table, by their names.
tell() {
    local name text
    for name; do
        text=${name#*=}
        case $name in
        unreadable=*) echo "failed read_symlink: $tz/$text: Invalid argument" ;;
        bad_link=*) echo "warning Bad zoneinfo link $text" ;;
        bad_path=*) echo "warning mira_dataset::create_components: bad path $text" ;;
        unparsed=*)
            printf 'warning Cannot parse version string %s\n' "$text, results.size() = 0" "$text" ;;
        correcting=*) echo "warning Correcting localtime link to $text" ;;
        *) echo "warning ${!name}" ;;
        esac
    done
}

# place LINK TEXT: a link with the text of a row, or what that names: a file, a directory or none.
place() {
    rm -f "$1"
    case $2 in
    none) ;;
    file) file "$1" ;;
    directory) mkdir "$1" ;;
    *) link "$1" "$2" ;;
    esac
}

# Which dataset is current after a start, by the one that was and by the latest one. A dataset is
# named by its version; the system's is 2016f, later years have other ICU formats, and 2016i is not
# there. A name that begins with a slash or tz/ is the text of the link that would name a dataset.
# Current        Latest         Then current  Marker   Record               Warnings
long=/$(printf 'x%.0s' {1..1023})
while read -r current latest after marker record warnings; do
    usual_device
    for version in "$current" "$latest"; do
        case $version in
        system | none | file | /* | tz/* | 2016i.*) ;;
        2017*) install_update "$version" 48l ;;
        2018*) install_update "$version" 44b ;;
        *) install_update "$version" ;;
        esac
    done
    case $current in
    file | /* | tz/*) place $tz/zoneinfo "$current" ;;
    *) make_current "$current" ;;
    esac
    [[ -L /var/db/icutz ]] || link /var/db/icutz stale
    [[ $latest != [0-9]* ]] || latest=$tz/tz/$latest
    place $tz/tz_latest "$latest"
    mkdir -p $tz/needs_cleanup # left by an earlier start, as the next two
    file $tz/TZVersionDiffRecord 'that of an earlier switch'
    mkdir /var/db/icu
    find /usr/share /var -exec touch -hd 2040-01-01 {} + # past the dates of 32-bit systems
    {
        tell $warnings
        case $after in
        "$current") ;;
        system) printf '%s\n' "zoneinfo $system" 'icutz none' ;;
        *) printf '%s\n' "zoneinfo $tz/tz/$after/zoneinfo" "icutz $tz/tz/$after/icutz" ;;
        esac
        echo "marker $marker"
        [[ $record == - ]] || echo "record $record"
        echo 'other /var/db/icu'
    } >row
    start "$current is current, $latest the latest" <row
done <<END
system           none           system        none     -
system           2016g.1.0      2016g.1.0     none     2016f.1.0_2016g.1.0
system           2016f.1.1      2016f.1.1     none     2016f.1.0_2016f.1.1
system           2016f.1.0      system        none     -                    not_taken
system           2017a.1.0      system        none     -                    not_taken
system           2016g.1.0/     system        none     -                    unparsed=2016g.1.0/ not_taken
2016g.1.0        2147483648a    system        none     -                    no_data
2016g.1.0        none           2016g.1.0     none     -
2016f.1.0        2016g.1.0      2016g.1.0     touched  2016f.1.0_2016g.1.0
2016g.1.0        2016h.1.0      2016h.1.0     touched  2016g.1.0_2016h.1.0
2016g.1.0        2016g.1.0      2016g.1.0     none     -                    not_taken
2016h.1.0        2016g.1.0      2016h.1.0     none     -                    not_taken
2016e.1.0        none           system        touched  -                    incompatible
2017a.1.0        none           system        touched  -                    incompatible
2018a.1.0        none           system        touched  -                    incompatible
2016g.1.0/x      none           system        touched  -                    unparsed=2016g.1.0/x incompatible
2016e.1.0        2016g.1.0      2016g.1.0     touched  2016f.1.0_2016g.1.0  incompatible
2016d.1.0        2016e.1.0      2016e.1.0     touched  2016f.1.0_2016e.1.0  incompatible
2016i.1.0        2016h.1.0      system        touched  -                    incompatible not_taken
2017a.1.0        2017b.1.0      system        touched  -                    incompatible not_taken
2147483648a      none           system        none     -                    no_data
2016g.1.0        ${long}cut     system        none     -                    bad_path=$long no_data
2016g.1.0        $tz/tz/        system        none     -                    bad_path=$tz/tz/ no_data
2016g.1.0        $tz/tzx/1a     system        none     -                    bad_path=$tz/tzx/1a no_data
2016g.1.0        ${system}      system        none     -                    bad_path=$system no_data
2016g.1.0        tz/2016h.1.0   system        none     -                    bad_path=tz/2016h.1.0 no_data
2016e.1.0        /x$tz/tz/1a    system        touched  -                    incompatible bad_path=/x$tz/tz/1a no_data
$system/         none           system        none     -                    bad_link=$system/ bad_links
tz/2016g.1.0/x   none           system        none     -                    bad_link=tz/2016g.1.0/x bad_links
$tz/tz/          none           system        none     -                    bad_link=$tz/tz/ bad_links
$tz/tz/1a        none           system        none     -                    bad_link=$tz/tz/1a bad_links
$tz/tz//x        none           system        none     -                    bad_link=$tz/tz//x bad_links
$tz/tzx/1a/x     none           system        none     -                    bad_link=$tz/tzx/1a/x bad_links
$tz/tz/x/        none           system        touched  -                    unparsed=x incompatible
/x$tz/tz/1a/x    2016g.1.0      2016g.1.0     none     2016f.1.0_2016g.1.0  bad_link=/x$tz/tz/1a/x bad_links
file             none           system        none     -                    unreadable=zoneinfo bad_links
file             file           system        none     -                    unreadable=tz_latest no_data
END

# What becomes of a local-time link: what it is corrected to, and what it is reset to.
while read -r before after warnings; do
    usual_device
    file /var/db/icu/entry # cannot be removed, and is no one's concern
    place $tz/localtime "$before"
    tell $warnings >row
    [[ $after == - ]] || echo "localtime $after" >>row
    start "the local-time link is $before" <row
done <<END
$zones/No/Zone                          -
$zones                                  -
${zones}X                               -
/usr/share/zoneinfo//Asia/Tokyo         $zones//Asia/Tokyo  correcting=$zones//Asia/Tokyo
/usr/share/zoneinfo                     $zones             correcting=$zones
/usr/share/zoneinfo/Asia/Tokyo/Zone     $default_zone      correcting=$zones/Asia/Tokyo/Zone reset_zone
/usr/share/zoneinfo.default/Asia/Tokyo  $default_zone      correcting=$zones.default/Asia/Tokyo reset_zone
/usr/share/zoneinf                      $default_zone      reset_zone
/var/db/timezone/zoneinf                $default_zone      reset_zone
/x$zones/Asia/Tokyo                     $default_zone      reset_zone
/x/usr/share/zoneinfo/Asia/Tokyo        $default_zone      reset_zone
../zoneinfo/Asia/Tokyo                  $default_zone      reset_zone
none                                    $default_zone      reset_zone
directory                               $default_zone      unreadable=localtime reset_zone
END

empty_device
install_update 2016g.1.0 none # is no format: both are unknown, and so the same
file /usr/share/icu/icutz77e.dat
link $tz/tz_latest $tz/tz/2016g.1.0
start 'the first start of a system without data' <<END
$(tell unparsed=.1.0)
failed Bad zoneinfo link : No such file or directory
failed $bad_links: No such file or directory
$(tell unparsed=.1.0 unparsed=.1.0)
failed $reset_zone: No such file or directory
zoneinfo $tz/tz/2016g.1.0/zoneinfo
icutz $tz/tz/2016g.1.0/icutz
localtime $default_zone
record .1.0_2016g.1.0
END

# A directory stands where a link is to be.
usual_device
install_update 2016g.1.0
link $tz/tz_latest $tz/tz/2016g.1.0
mkdir /var/db/icutz
kept_icu="failed remove: could not remove /var/db/icutz: Is a directory
failed unlink of ICU softlink failed: Is a directory"
start 'the ICU link cannot be made' <<END
$kept_icu
failed create_symlink: from /var/db/icutz to $tz/tz/2016g.1.0/icutz: File exists
failed $no_data: File exists
$kept_icu
END
usual_device
rm $tz/localtime
file $tz/localtime/entry
start 'the local-time link cannot be made' <<END
$(tell unreadable=localtime)
failed $reset_zone: Invalid argument
failed create_symlink: from $tz/localtime to $default_zone: File exists
exit 1
END
rm $tz/zoneinfo
mkdir $tz/zoneinfo
kept_zoneinfo="failed remove: could not remove $tz/zoneinfo: Is a directory
failed Unlink of zoneinfo softlink failed: Is a directory
failed create_symlink: from $tz/zoneinfo to $system: File exists"
start 'the zoneinfo link cannot be made' <<END
$(tell unreadable=zoneinfo)
failed $bad_links: Invalid argument
$kept_zoneinfo
failed $no_data: File exists
$kept_zoneinfo
exit 1
END
install_system 2147483648a
start 'the version of the system has a number too large' <<<"$(tell no_data)"$'\nexit 1'
rm -r $tz
install_system 2016f
file $tz
start 'a file stands for the directory of the links' <<END
failed read_symlink: $tz/tz_latest: Not a directory
failed $no_data: Not a directory
failed remove: could not remove $tz/zoneinfo: Not a directory
failed Unlink of zoneinfo softlink failed: Not a directory
failed create_symlink: from $tz/zoneinfo to $system: Not a directory
exit 1
END

# A busy start, whatever becomes of its surroundings. Signals do what they do by default.
with_signals=(env "--default-signal=PIPE,XFSZ")
with_full_mask() (umask 0 && "$@")
without_errors() { "$@" 2>&-; }
without_reader() (
    mkfifo pipe
    exec 8<>pipe 9>pipe 8>&- # its only reader is gone
    "${with_signals[@]}" "$@" 2>&9
)
without_room() (ulimit -f 0 && "${with_signals[@]}" "$@")
busy_device
start 'the mask leaves every permission' with_full_mask <<END
$(tell incompatible)
$told
$links
marker touched, mode 666
record 2016f.1.0_2016g.1.0, mode 666
END
for circumstance in without_errors without_reader; do
    busy_device
    start "standard error is nowhere, $circumstance" $circumstance <<<"$links"$'\n'"$files"
done
busy_device
start 'no file may grow' without_room <<<"$links"$'\nmarker touched\nrecord touched'
busy_device
mkdir $tz/needs_cleanup $tz/needs_cleanup/occupied $tz/TZVersionDiffRecord
start 'marker and record cannot be written' <<END
$(tell incompatible)
failed Cannot touch file $tz/needs_cleanup: Is a directory
$told
$links
END
