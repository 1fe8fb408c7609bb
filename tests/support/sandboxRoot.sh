#!/bin/sh
# SPDX-License-Identifier: Apache-2.0
# Builds the file system that a sandbox sees and makes it "/" of its mount namespace, which must be a new one: an overlay
# over the machine's, or a tmpfs of links to it, which stays at /.host then.
#
#   sandboxRoot.sh overlay|links <path>...    the paths stay visible, also below directories that are fresh
# shellcheck disable=SC2015,SC2086  # the paths are those of this script
set -eu
kind=$1
shift
mount --make-rprivate /
umask 022

# Where the new root is put together: anywhere but above what must stay visible.
for stage in /mnt /media /srv /opt; do
    case " $* " in *" $stage/"*) continue ;; esac
    [ ! -d $stage ] || break
done
mount -t tmpfs -o mode=755 sandbox $stage
root=$stage/root
mkdir $stage/upper $stage/work $root

# An overlay can be mounted and yet refuse to create anything, for example when the ids of files are not mapped.
overlay() {
    layers=lowerdir=/,upperdir=$stage/upper,workdir=$stage/work
    mount -t overlay -o $layers overlay $root || mount -t overlay -o $layers,userxattr overlay $root || return 1
    mkdir -p $root/.host $root/usr/veld || { umount $root && return 1; }
}

# An overlay shows one mount only: the other mounts of the machine are bound in. Files that are mounts (a container's
# /etc/hosts) are copied, because a mount point cannot be replaced.
bind_other_mounts() {
    while read -r _ point _; do
        case $point/ in
            // | /proc/* | /sys/* | /dev/* | /tmp/* | /run/* | /usr/veld/* | $stage/*) continue ;;
        esac
        if [ -d "$point" ]; then
            mkdir -p "$root$point" && mount --bind "$point" "$root$point"
        elif [ -f "$point" ]; then
            cp --remove-destination "$point" "$root$point"
        fi || true
    done </proc/self/mounts
}

# Fills the new root with links: directories in which tests create or replace entries are directories of links.
# Others of "/" are bound, so that the real path of a program is the same inside and outside.
link_all() {
    mount -t tmpfs -o mode=755 sandbox $root
    for path in /*; do
        case $path in
            /proc | /sys | /dev | /tmp | /run) ;;
            /usr | /etc | /var | /bin | /sbin | /lib) cp -P "$path" $root 2>/dev/null || mkdir $root"$path" ;;
            *) if [ -d "$path" ] && [ ! -L "$path" ]; then
                   mkdir "$root$path" && mount --rbind "$path" "$root$path" || true
               else
                   cp -P "$path" $root
               fi ;;
        esac
    done
    for path in /usr/lib/modules /lib/modules /etc/alternatives /var/lib /usr/share /usr/bin /usr/sbin /usr/lib /usr \
        /bin /sbin /lib /etc /var; do
        [ -d $path ] && [ ! -L $path ] || continue
        mkdir -p $root$path
        find $path -mindepth 1 -maxdepth 1 ! -path /usr/veld -printf '/.host%p\0' |
            xargs -0r ln -st $root$path 2>/dev/null || true  # what is a directory there already stays one
    done
}

if [ "$kind" = overlay ] && overlay; then bind_other_mounts; else kind=links && link_all; fi

mkdir -p $root/.host $root/proc $root/sys $root/dev $root/tmp $root/run $root/usr/veld
for path in /run /usr/veld /dev; do echo "sandbox $root$path tmpfs mode=755"; done >$stage/fstab
echo "sandbox $root/tmp tmpfs mode=1777" >>$stage/fstab
mount --all --fstab $stage/fstab
mkdir -m 1777 $root/run/lock $root/dev/shm $root/dev/net $root/dev/pts
# Usually a link to /run/lock, and then fresh already.
[ -L $root/var/lock ] || { mkdir -p $root/var/lock && mount -t tmpfs -o mode=1777 sandbox $root/var/lock; }
ln -s pts/ptmx $root/dev/ptmx
cp -P /dev/fd /dev/stdin /dev/stdout /dev/stderr $root/dev

# Kernel modules belong to the whole machine: without a list of what is there and what is loaded, none is loaded or
# removed. The kernel itself still loads what a rule needs.
{
    for device in null zero full random urandom tty net/tun; do
        [ ! -e /dev/$device ] || echo "/dev/$device $root/dev/$device none bind"
        : >$root/dev/$device
    done
    echo "devpts $root/dev/pts devpts newinstance,ptmxmode=0666,mode=0620"
    echo "proc $root/proc proc nosuid,nodev,noexec"
    echo "sysfs $root/sys sysfs nosuid,nodev,noexec"
    for path in /sys/module /usr/lib/modules; do [ ! -d $path ] || echo "sandbox $root$path tmpfs mode=755"; done
} >$stage/fstab
# Where the machine hides parts of its own, the kernel allows no new ones.
mount --all --fstab $stage/fstab || {
    for path in /dev/pts /proc /sys; do mountpoint -q $root$path || mount --rbind $path $root$path; done
    mountpoint -q $root/sys/module || [ ! -d $root/sys/module ] || mount -t tmpfs sandbox $root/sys/module
}

for path; do
    for fresh in /tmp /run /usr/veld /dev; do
        case $path in $fresh/*) rest=${path#"$fresh"/} && entry=$fresh/${rest%%/*} ;; *) continue ;; esac
        [ -d "$entry" ] && [ ! -d "$root$entry" ] || continue
        mkdir -p "$root$entry" && mount --rbind "$entry" "$root$entry"
    done
done

cd $root
pivot_root . .host
[ $kind = links ] || { umount -l /.host && rmdir /.host; }
