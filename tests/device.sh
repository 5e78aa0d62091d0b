# shellcheck shell=bash disable=SC2034
# The words for devices: lay one out, start it, and compare what the start did with a promise.
[[ -e /device.sh ]] || exit # in a device only, where paths are those of the system

tz=/var/db/timezone zones=/var/db/timezone/zoneinfo system=/usr/share/zoneinfo.default
default_zone=$zones/America/Los_Angeles
incompatible='Symlink points at data incompatible with installed system'
not_taken='New update not compatible or older version'
bad_links='Invalid current symlinks; resetting to system partition'
no_data='Unable to locate data; resetting to system partition'
reset_zone='localtime link invalid; resetting to America/Los_Angeles'

# file PATH [CONTENT] and link PATH TEXT make the directories above as well.
file() { mkdir -p "${1%/*}" && printf %s "${2-}" >"$1"; }
link() { mkdir -p "${1%/*}" && ln -sfn "$2" "$1"; }

empty_device() { rm -rf var usr/share && mkdir -p usr/share var/db; }

# install_system VERSION, install_update VERSION [FORMAT]: the system's ICU format is 44l, and so is
# an update's where no other is named. Each also holds decoys, which are read in the other only.
install_system() {
    file $system/+VERSION "$1"$'\n'
    file $system/Asia/Tokyo
    file /usr/share/icu/icutzformat.txt $' 44l more\n'
    file /usr/share/icu/icutz77e.dat
}
install_update() {
    file "$tz/tz/$1/zoneinfo/+VERSION" 1999z$'\n'
    file "$tz/tz/$1/icutz/icutzformat.txt" 77e
    file "$tz/tz/$1/icutz/icutz${2-44l}.dat"
}

# make_current VERSION: links the data of an update, or of the system by the name "system".
make_current() {
    rm -rf var/db/icutz
    link $tz/zoneinfo $system
    if [[ $1 != system ]]; then
        link $tz/zoneinfo "$tz/tz/$1/zoneinfo"
        link /var/db/icutz "$tz/tz/$1/icutz"
    fi
}

# A device with nothing to do, and one whose next start gives up an update, switches to another and
# resets the local-time link: what that tells, and what it leaves.
usual_device() {
    empty_device
    install_system 2016f
    make_current system
    link $tz/localtime $zones/Asia/Tokyo
}
busy_device() {
    usual_device
    install_update 2016e.1.0
    install_update 2016g.1.0
    make_current 2016e.1.0
    link $tz/tz_latest $tz/tz/2016g.1.0
    link $tz/localtime /usr/share/zoneinfo/No/Zone
}
told="warning Correcting localtime link to $zones/No/Zone
failed $reset_zone: No such file or directory"
links="zoneinfo $tz/tz/2016g.1.0/zoneinfo
icutz $tz/tz/2016g.1.0/icutz
localtime $default_zone"
files='marker touched
record 2016f.1.0_2016g.1.0'

# What a device tells: its links, marker and record, and the local time that is read through them.
facts() {
    fact zoneinfo $tz/zoneinfo
    fact icutz /var/db/icutz
    fact localtime $tz/localtime
    fact marker $tz/needs_cleanup
    fact record $tz/TZVersionDiffRecord
    local_time
}
fact() { # NAME PATH
    local is=none
    if [[ -L $2 ]]; then
        is=$(readlink "$2")
    elif [[ -f $2 ]]; then
        is=$(tr '\0' @ <"$2" && stat -c ', mode %a' "$2")
        [[ -s $2 ]] || is=touched$is
        is=${is%, mode 644}
    elif [[ -e $2 ]]; then
        is='a directory'
    fi
    printf '%-9s %s\n' "$1" "$is"
}
local_time() { :; }

# Everything else on the device.
others() {
    find /usr/share /var -type d -printf '%p %m\n' -o -printf '%p %m %s %T@ %l\n' | sort |
        sed -E "\,^(/var/db/icutz|$tz/(zoneinfo|localtime|needs_cleanup|TZVersionDiffRecord)) ,d"
}

# start WHAT [COMMAND...] <<PROMISE: starts the device, by COMMAND if there is one, and compares
# what that did with the promise; the program ignores its argument. A line of a promise is one of
#     warning TEXT          a warning, with whatever error text an earlier call has left
#     failed TEXT: ERROR    a warning with the error of the call that has just failed
#     zoneinfo TEXT         a fact that changes; those that are not named stay, like all else
#     other PATH            something else that comes, goes or changes
#     exit STATUS           where it is not 0
start() {
    local key text status=0
    while read -r key text; do
        printf '%-9s %s\n' "$key" "$text"
    done >promised
    facts >facts_before
    others >others_before
    "${@:2}" /mira_tzlinks --version >output 2>errors || status=$?
    facts >facts_after
    others >others_after
    {
        # Output, and warnings of another form, stand as they are.
        cat output
        awk 'FILENAME == "promised" { failed[FNR] = /^failed/; next }
            failed[FNR] { sub(/^mira_tzlinks: /, "failed    ") }
            !failed[FNR] && sub(/: [A-Z][^:]*$/, "") { sub(/^mira_tzlinks: /, "warning   ") }
            { print }' promised errors
        grep -Fxv -f facts_before facts_after || [[ $? -eq 1 ]]
        { diff others_before others_after || [[ $? -eq 1 ]]; } |
            sed -n 's|^[<>] \([^ ]*\).*|other     \1|p' | sort -u
        [[ $status -eq 0 ]] || echo "exit      $status"
    } >seen
    compare "$1"
}

# compare WHAT: compares the file "seen" with the file "promised".
promises=0 failures=0
compare() {
    promises=$((promises + 1))
    diff -u --label promised --label seen promised seen >difference || failures=$((failures + 1))
    report "$1"
}
report() { [[ ! -s difference ]] || { echo "NOT AS PROMISED: $1" && cat difference; }; }

ended() {
    echo "$((promises - failures)) of $promises promises were kept."
    [[ $promises -gt 0 && $failures -eq 0 ]]
}
