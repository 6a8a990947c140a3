# shellcheck shell=bash
# A machine for tests of packages: a root directory with Debian's packages alone, and a systemd of its own that runs in it,
# in namespaces. Root only. A script sets `work`, a directory of its own, and sources this file; it is ended by "machine_off".

fail() {
    echo "FAILED: $*" >&2
    exit 1
}

# create_base DIRECTORY PACKAGE...: a root with the distribution of this machine, and these packages. It is kept for the next run.
create_base() {
    local base=$1 codename mirror
    shift
    codename=$(. /etc/os-release && echo "$VERSION_CODENAME")
    mirror=$(apt-get indextargets --format '$(CODENAME) $(COMPONENT) $(SITE)' 'Created-By: Packages' |
        sed -n "s/^$codename main //p" | head -n 1)
    if [ ! -e "$base/complete" ]; then
        rm -rf "$base"
        mkdir -p "$base"
        debootstrap --variant=minbase --include=systemd,systemd-sysv,dbus "$codename" "$base/root" ${mirror:+"$mirror"} \
            >"$base/log" 2>&1 || { tail "$base/log"; fail "debootstrap"; }
        # No service is started in there, nothing of this machine's network is contacted later, and dpkg is quick.
        echo force-unsafe-io >"$base/root/etc/dpkg/dpkg.cfg.d/speed"
        local unit
        for unit in apt-daily.timer apt-daily-upgrade.timer dpkg-db-backup.timer e2scrub_all.timer fstrim.timer; do
            ln -s /dev/null "$base/root/etc/systemd/system/$unit"
        done
        touch "$base/complete"
    fi
    cp /etc/resolv.conf "$base/root/etc/resolv.conf"
    unshare --mount --propagation private -- sh -c '
        mount --bind /proc "$0/proc" && mount --bind /dev "$0/dev" && export DEBIAN_FRONTEND=noninteractive
        shift 0
        chroot "$0" apt-get install -y -q --no-install-recommends "$@" >>"$0/../log" 2>&1' "$base/root" "$@" ||
        { tail "$base/log"; fail "the packages could not be installed: $*"; }
}

# dependencies_of FILE...: what the package files need besides each other, and what apt installs with them.
dependencies_of() {
    local file own
    own=$(for file; do dpkg-deb --field "$file" Package Provides; done | sed 's/.*: //')
    for file; do dpkg-deb --field "$file" Depends Recommends | sed 's/^[A-Za-z]*: //'; done | tr ',' '\n' | sed 's/|.*//; s/(.*//; s/ //g; /^$/d' | sort -u |
        grep -vxF "$own"
}

# The process that becomes systemd: machine_boot ROOT.
machine_boot() {
    local root=$1
    mount --make-rprivate /
    mount --bind "$root" "$root"
    cd "$root"
    mount -t proc proc proc
    mount -t sysfs -o ro sysfs sys
    mount -t cgroup2 cgroup2 sys/fs/cgroup
    mount -t tmpfs -o mode=755 tmpfs dev
    mknod -m 666 dev/null c 1 3
    mknod -m 666 dev/zero c 1 5
    mknod -m 666 dev/full c 1 7
    mknod -m 666 dev/random c 1 8
    mknod -m 666 dev/urandom c 1 9
    mknod -m 666 dev/tty c 5 0
    ln -s /proc/self/fd dev/fd
    mkdir dev/pts dev/shm
    mount -t devpts -o newinstance,ptmxmode=0666,mode=620 devpts dev/pts
    ln -s pts/ptmx dev/ptmx
    mount -t tmpfs tmpfs dev/shm
    mount -t tmpfs -o mode=755 tmpfs run
    mount -t tmpfs -o mode=1777 tmpfs tmp
    hostname sample
    ip link set lo up
    pivot_root . .
    umount -l .
    exec env -i PATH=/usr/sbin:/usr/bin:/sbin:/bin container=test /lib/systemd/systemd --system --log-target=journal </dev/null
}

# machine_on ROOT: starts the machine; `machine` is the process id of its systemd.
machine_on() {
    group=adminhost-packages.$$
    mkdir -p "$work/groups"
    mount -t cgroup2 cgroup2 "$work/groups" || fail "control groups of version 2 cannot be mounted"
    mkdir "$work/groups/$group"
    (
        echo "$BASHPID" >"$work/groups/$group/cgroup.procs"
        exec setpriv --pdeathsig KILL unshare --pid --fork --kill-child --mount --uts --ipc --net --cgroup \
            bash -eu -c '. "$0" && machine_boot "$1"' "${BASH_SOURCE[0]}" "$1"
    ) >"$work/boot.log" 2>&1 &
    local outer=$! i
    machine=
    for ((i = 0; i < 3000; i++)); do
        machine=$(cat "/proc/$outer/task/$outer/children" 2>/dev/null || true)
        machine=${machine%% *}
        if [ -n "$machine" ] && [ -S "/proc/$machine/root/run/systemd/private" ] &&
            in_machine systemctl is-active --quiet dbus.service 2>/dev/null; then
            return
        fi
        kill -0 "$outer" 2>/dev/null || break
        sleep 0.02
    done
    cat "$work/boot.log"
    fail "systemd did not start"
}

machine_off() {
    if [ -n "${machine-}" ]; then kill -KILL "$machine" 2>/dev/null || true; fi
    wait || true
    machine=
    [ -n "${group-}" ] || return 0
    local i
    # The kernel needs a moment for a group whose last process has just ended.
    for ((i = 0; i < 500; i++)); do
        find "$work/groups/$group" -depth -type d -exec rmdir {} + 2>/dev/null && break
        sleep 0.01
    done
    umount "$work/groups" 2>/dev/null || true
}

# in_machine COMMAND...: runs a command there.
in_machine() {
    nsenter -t "$machine" --mount --pid --uts --ipc --net --cgroup --root --wd -- env -i PATH=/usr/sbin:/usr/bin:/sbin:/bin \
        HOME=/root TERM=dumb DEBIAN_FRONTEND=noninteractive "$@"
}

# within SECONDS COMMAND...: waits until the command succeeds.
within() {
    local end=$((SECONDS + $1))
    shift
    until "$@"; do
        [ $SECONDS -lt $end ] || return 1
        sleep 0.05
    done
}
