#!/bin/bash
# tests/bus/sandbox.sh: runs a command as root beside a private system bus and the real polkitd.
#
#   sandbox.sh [-l DIR]... [-r DIR]... [-w DIR]... [-b FILE]... [--] COMMAND [ARGUMENT...]
#
#   -l DIR  lay DIR over the sandbox's root before anything starts: DIR/usr/sbin/..., DIR/etc/...
#   -r DIR  show DIR as it is, read-only (a source tree)
#   -w DIR  let writes below DIR through to the real file system (a build directory)
#   -b FILE let the bus include FILE, of a folder that is shown, after all others
#
# COMMAND sees this machine through a copy-on-write view: what it writes to /etc, /usr, /run or /tmp
# lands in memory and is gone afterwards. It has mount, PID, network, IPC and UTS namespaces of its
# own and a nearly empty /dev: a test makes the /dev/log or /dev/rtc it needs. The kernel's switches
# in /proc and /sys are read-only, and the capabilities to set the clock, to reboot and to load
# modules are dropped for good. All processes die with COMMAND.
#
# /run/bus-sandbox holds dbus-daemon.pid, polkitd.pid and what the two printed.
# Exit status: COMMAND's; 125: no sandbox.
set -euo pipefail

MARK=bus-sandbox # the name of the root's file system: tests know by it that they are inside
STATE=/run/bus-sandbox
STOCK_BUS=/usr/share/dbus-1
DROPPED=-sys_time,-sys_boot,-sys_module,-sys_rawio,-syslog,-wake_alarm

die() { echo "sandbox.sh: $*" >&2; exit 125; }

self=$(realpath -e -- "$0")
original=("$@")
layers=() shown=("$(dirname "$self")") through=() included=()
while [ $# -gt 0 ]; do
    case $1 in
        -l) layers+=("$(realpath -e -- "$2")") || exit 125; shift 2 ;;
        -r) shown+=("$(realpath -e -- "$2")") || exit 125; shift 2 ;;
        -b) included+=("$(realpath -e -- "$2")") || exit 125; shift 2 ;;
        -w) through+=("$(realpath -e -- "$2")") || exit 125; shift 2 ;;
        --) shift; break ;;
        -*) die "unknown option $1" ;;
        *) break ;;
    esac
done
[ $# -gt 0 ] || die "no command"

# find_polkitd: where it is on this machine, which differs between distributions.
find_polkitd() {
    local program
    for program in /usr/lib/polkit-1/polkitd /usr/libexec/polkitd; do
        [ ! -x $program ] || { echo $program; return; }
    done
    return 1
}

# The caller's may keep the daemons' own users out of what is made here.
umask 022

# Outside: makes the namespaces, and the folder in which the new root is put together.
enter_namespaces() {
    [ "$(id -u)" = 0 ] || die "needs root"
    local tool scratch status=0
    for tool in unshare findmnt mount pivot_root setpriv tar dbus-daemon gdbus systemd-sysusers; do
        command -v $tool >/dev/null || die "needs $tool; run: tools/install_dependencies test"
    done
    [ -e $STOCK_BUS/system.conf ] ||
        die "needs dbus-system-bus-common; run: tools/install_dependencies test"
    find_polkitd >/dev/null || die "needs polkitd; run: tools/install_dependencies test"
    scratch=$(mktemp -d)
    env -i PATH=/usr/sbin:/usr/bin:/sbin:/bin HOME=/root LANG=C.UTF-8 TERM="${TERM:-dumb}" \
        SANDBOX_STAGE=root SANDBOX_SCRATCH="$scratch" \
        SANDBOX_OUTSIDE="$(readlink /proc/self/ns/mnt)" \
        unshare --mount --pid --net --ipc --uts --fork --kill-child --propagation private -- \
        "$self" "${original[@]}" || status=$?
    rmdir -- "$scratch"
    exit $status
}

# A file system as it is, with a layer of memory for what is written.
overlay() {
    local lower=$1 target=$2 layer=$3
    mkdir -p "$layer/upper" "$layer/work" &&
        mount -t overlay "$MARK" "$target" \
            -o "lowerdir=$lower,upperdir=$layer/upper,workdir=$layer/work"
}

# Mount points below / are no part of an overlay of /: each becomes one of its own, or read-only.
make_copy_on_write_root() {
    local root=$1 memory=$2 count=0 mounted
    overlay / "$root" "$memory/0" || die "cannot lay an overlay over /"
    while read -r mounted; do
        [ -d "$root$mounted" ] || continue
        count=$((count + 1))
        overlay "$mounted" "$root$mounted" "$memory/$count" 2>/dev/null ||
            { mount --bind "$mounted" "$root$mounted" &&
                mount -o remount,bind,ro "$root$mounted"; } ||
            die "cannot show $mounted"
    done < <(findmnt -rno TARGET | grep -vE '^/$|^/(proc|sys|dev|run|tmp)(/|$)' |
        grep -vxF "$memory" | sort -u)
}

make_kernel_file_systems() {
    local root=$1 switch
    mount -t proc proc "$root/proc"
    for switch in /proc/sys /proc/sysrq-trigger; do
        [ -e "$root$switch" ] || continue
        mount --bind "$root$switch" "$root$switch"
        mount -o remount,bind,ro "$root$switch"
    done
    mount -t sysfs -o ro sysfs "$root/sys"
    mount -t tmpfs -o mode=0755 run "$root/run"
    mount -t tmpfs -o mode=1777 tmp "$root/tmp"
}

make_devices() {
    local root=$1 name
    mount -t tmpfs -o mode=0755 dev "$root/dev"
    mkdir -p "$root/dev/pts" "$root/dev/shm"
    for name in null zero full random urandom tty; do
        : >"$root/dev/$name"
        mount --bind "/dev/$name" "$root/dev/$name"
    done
    mount -t devpts -o newinstance,ptmxmode=0666 devpts "$root/dev/pts"
    mount -t tmpfs -o mode=1777 shm "$root/dev/shm"
    ln -s pts/ptmx "$root/dev/ptmx"
    ln -s /proc/self/fd "$root/dev/fd"
}

# What stands in somebody's home folder is found by all users of the sandbox, too.
open_way() { # ROOT DIRECTORY
    local parent=$2
    while parent=$(dirname "$parent") && [ "$parent" != / ]; do
        [ -n "$(find "$1$parent" -maxdepth 0 -perm -a+x)" ] || chmod a+x "$1$parent" ||
            die "cannot open $parent"
    done
}

show_directories() {
    local root=$1 directory
    for directory in "${shown[@]}" ${through[@]+"${through[@]}"}; do
        mkdir -p "$root$directory"
        open_way "$root" "$directory"
    done
    for directory in "${shown[@]}"; do
        mount --bind "$directory" "$root$directory"
        mount -o remount,bind,ro "$root$directory"
    done
    for directory in ${through[@]+"${through[@]}"}; do
        mount --bind "$directory" "$root$directory"
    done
}

lay_over() {
    local root=$1 directory
    for directory in ${layers[@]+"${layers[@]}"}; do
        tar -C "$directory" -cf - --owner=0 --group=0 . |
            tar -C "$root" -xf - --keep-directory-symlink --no-overwrite-dir ||
            die "cannot lay $directory over the root"
        (cd "$directory" && find . -path './usr/lib/sysusers.d/*.conf' -printf '/%P\n') \
            >>"$root$STATE/sysusers"
    done
}

# In the namespaces: puts the new root together, moves into it, and drops capabilities.
enter_root() {
    if [ $$ != 1 ] || [ "$(readlink /proc/self/ns/mnt)" = "$SANDBOX_OUTSIDE" ]; then
        die "these are not namespaces of its own; start it without SANDBOX_STAGE"
    fi
    local memory=$SANDBOX_SCRATCH root=$SANDBOX_SCRATCH/root
    mount -t tmpfs -o mode=0755 "$MARK" "$memory"
    mkdir "$root"
    make_copy_on_write_root "$root" "$memory"
    make_kernel_file_systems "$root"
    make_devices "$root"
    show_directories "$root"
    mkdir -p "$root$STATE" "$root/.outside"
    lay_over "$root"
    cd "$root"
    pivot_root . .outside
    umount --lazy /.outside
    rmdir /.outside

    cd /
    local file options=()
    for file in ${included[@]+"${included[@]}"}; do
        options+=(-b "$file")
    done
    SANDBOX_STAGE=bus exec setpriv --bounding-set=$DROPPED --inh-caps=$DROPPED -- \
        "$self" ${options[@]+"${options[@]}"} -- "$@"
}

# The stock policy of a system bus, as a foreground program that starts no services.
write_bus_configuration() {
    local file includes=''
    for file in ${included[@]+"${included[@]}"}; do
        includes+="<include>$file</include>"
    done
    sed -e '/<fork\/>/d' -e '/<syslog\/>/d' -e '/<pidfile>/d' -e '/<servicehelper>/d' \
        -e '/<standard_system_servicedirs\/>/d' \
        -e "s|<includedir>system.d<|<includedir>$STOCK_BUS/system.d<|" \
        -e "s|</busconfig>|$includes</busconfig>|" $STOCK_BUS/system.conf \
        >$STATE/bus.conf
}

make_system_users() {
    local files
    mapfile -t files < <(cat $STATE/sysusers 2>/dev/null)
    [ ${#files[@]} = 0 ] || systemd-sysusers "${files[@]}" 2>$STATE/sysusers.log ||
        { cat $STATE/sysusers.log >&2; die "cannot make the users of ${files[*]}"; }
}

start_bus() {
    local tries=0
    mkdir -p /run/dbus
    write_bus_configuration
    dbus-daemon --config-file=$STATE/bus.conf --nofork --nopidfile >$STATE/dbus-daemon.log 2>&1 &
    echo $! >$STATE/dbus-daemon.pid
    until [ -S /run/dbus/system_bus_socket ]; do
        tries=$((tries + 1))
        [ $tries -lt 1000 ] || { cat $STATE/dbus-daemon.log >&2; die "no bus"; }
        sleep 0.01
    done
}

start_polkitd() {
    local program
    program=$(find_polkitd)
    # It reads its folders as its own user.
    mkdir -p /etc/polkit-1/rules.d /usr/share/polkit-1/rules.d
    chown -R polkitd /etc/polkit-1/rules.d /usr/share/polkit-1/rules.d
    "$program" --no-debug >$STATE/polkitd.log 2>&1 &
    echo $! >$STATE/polkitd.pid
    gdbus wait --system --timeout 10 org.freedesktop.PolicyKit1 ||
        { cat $STATE/polkitd.log >&2; die "no polkitd"; }
}

# tell_of_ended NAME: how a daemon ended that should have been there to the end.
tell_of_ended() {
    local pid status=0
    pid=$(<"$STATE/$1.pid")
    [ ! -e "/proc/$pid" ] || return 0
    wait "$pid" 2>/dev/null || status=$?
    echo "sandbox.sh: $1 ended before the tests did, with status $status" >&2
}

case ${SANDBOX_STAGE:-outside} in
    outside) enter_namespaces ;;
    root) enter_root "$@" ;;
    bus)
        if [ $$ != 1 ] || [ "$(findmnt -no SOURCE /)" != $MARK ]; then
            die "the root is not a private one"
        fi
        make_system_users
        start_bus
        start_polkitd
        unset SANDBOX_STAGE SANDBOX_SCRATCH SANDBOX_OUTSIDE
        status=0
        "$@" || status=$?
        tell_of_ended dbus-daemon
        tell_of_ended polkitd
        exit $status
        ;;
esac
