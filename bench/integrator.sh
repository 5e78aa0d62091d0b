#!/bin/sh
# The program's job as an integrator would script it, to compare with. It leaves the same links,
# marker and record; only the data-protection class is out of a shell's reach.
export LC_ALL=C
timezone=/var/db/timezone system=/usr/share/zoneinfo.default

warn() { echo "${0##*/}: $*" >&2; }

first_word() { [ ! -r "$1" ] || { read -r word _ < "$1"; echo "$word"; }; }

# Prints a text that is a version; any other is older than every version, as the empty text is.
version() {
    echo "$1" | grep -Ex '[0-9]+[a-z]+(\.[0-9]+){0,2}' || warn "Cannot parse version string $1"
}

newer() { [ "$1" != "$2" ] && [ "$(printf '%s\n' "$1" "$2" | sort -V | tail -n 1)" = "$1" ]; }

icu_format() {
    find -H "$1/icutz" -xdev -maxdepth 1 -type f -perm -o=r -name 'icutz*.dat' 2> /dev/null |
        sed -nE 's|.*/icutz([0-9]+[lbe])\.dat$|\1|p' | head -n 1
}

reset_links() {
    warn "$1"
    ln -sfn $system $timezone/zoneinfo
    rm -f /var/db/icutz
}

rm -fd $timezone/needs_cleanup /var/db/icu 2> /dev/null
system_version=$(version "$(first_word $system/+VERSION).1.0")
system_format=$(first_word /usr/share/icu/icutzformat.txt)
current_version=$system_version active_version=$system_version current=$(readlink $timezone/zoneinfo)
case $current in
$timezone/tz/?*/*)
    current=${current%/*}
    current_version=$(version "${current##*/}")
    active_version=$current_version
    if [ "$(icu_format "$current")" != "$system_format" ] ||
        newer "$system_version" "$current_version"; then
        reset_links "Symlink points at data incompatible with installed system"
        touch $timezone/needs_cleanup
        active_version=$system_version
    fi ;;
"$system") ;;
*) reset_links "Invalid current symlinks; resetting to system partition" ;;
esac

latest=$(readlink $timezone/tz_latest)
if [ -n "$latest" ]; then
    latest_version=$(version "${latest##*/}")
    if [ "$(icu_format "$latest")" = "$system_format" ] &&
        newer "$latest_version" "$current_version"; then
        [ "$(readlink $timezone/zoneinfo)" = $system ] || touch $timezone/needs_cleanup
        ln -sfn "$latest/zoneinfo" $timezone/zoneinfo
        ln -sfn "$latest/icutz" /var/db/icutz
        printf %s "${active_version}_$latest_version" > $timezone/TZVersionDiffRecord
    else
        warn "New update not compatible or older version"
    fi
fi

zone=$(readlink $timezone/localtime)
case $zone in
$timezone/zoneinfo*) exit ;;
/usr/share/zoneinfo*) zone=$timezone/zoneinfo${zone#/usr/share/zoneinfo} ;;
*) zone= ;;
esac
[ -e "$zone" ] || zone=$timezone/zoneinfo/America/Los_Angeles
warn "Correcting localtime link to $zone"
ln -sfn "$zone" $timezone/localtime
