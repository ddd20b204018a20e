#!/usr/bin/env bash
# kernel-vm.sh: runs one host command inside a software-emulated VM whose
# Debian kernel has Bluetooth (bluetooth and hci_vhci loaded), because the
# host kernel has none. The VM sees the host root read-only through 9p and
# runs the command in a chroot of it, so host-built binaries run unchanged.
#
#   kernel-vm.sh [--timeout S] [--env NAME[=VALUE]]... -- COMMAND [ARGS...]
#
# Prints the command's stdout and stderr on ours and exits with its status.
# Harness failures exit 125 and a timeout exits 124, each with one stderr line.
set -euo pipefail

SELF=$(readlink -f "${BASH_SOURCE[0]}")
ROOT=$(dirname "$(dirname "$SELF")")
# The unpacked kernel, the initramfs and each run's logs.
CACHE=${VM_CACHE:-$ROOT/build/vm-cache}

die() { echo "kernel-vm: $*" >&2; exit 125; }

usage() {
    echo "usage: kernel-vm.sh [--timeout S] [--env NAME[=VALUE]]... -- COMMAND [ARGS...]" >&2
    exit 2
}

# qemu, Debian's kernel, busybox and xz, as the test command installs them.
install_missing() {
    bash "$ROOT/scripts/install-deps.sh" vm >"$CACHE/apt.log" 2>&1 ||
        die "could not install the VM's packages: $(tail -n 1 "$CACHE/apt.log") (see $CACHE/apt.log)"
}

# The newest installed kernel that ships the vhci driver.
pick_kernel() {
    local v
    for v in $(cd /boot && printf '%s\n' vmlinuz-* | sed -n 's/^vmlinuz-//p' | sort -rV); do
        [[ -f /lib/modules/$v/kernel/drivers/bluetooth/hci_vhci.ko ]] && { echo "$v"; return; }
    done
    die "no installed kernel with hci_vhci.ko in /lib/modules"
}

# Booting the uncompressed kernel through its PVH entry skips the xz
# decompression that costs about 3 s under emulation. Falls back to the
# bzImage if the payload cannot be unpacked.
kernel_image() {
    local img=/boot/vmlinuz-$KVER out=$CACHE/vmlinux-$KVER sects off
    if [[ ! -s $out ]]; then
        # x86 boot protocol: the payload starts payload_offset (0x248) bytes
        # after the setup_sects (0x1f1) + 1 sectors of real-mode code.
        sects=$(od -An -tu1 -j $((0x1f1)) -N1 "$img")
        off=$(od -An -tu4 -j $((0x248)) -N4 "$img")
        rm -f "$CACHE"/vmlinux-*
        # xz stops at the end of its stream, before tail ends: judge xz alone.
        if xz -dc --single-stream <(tail -c +$(((sects + 1) * 512 + off + 1)) "$img") \
            >"$out.tmp" 2>/dev/null; then
            mv "$out.tmp" "$out"
        else
            rm -f "$out.tmp"
        fi
    fi
    if [[ -s $out ]]; then echo "$out"; else echo "$img"; fi
}

# pid 1 of the VM. Its result goes to /io/status on the writable share, its
# own chatter only to the serial console, so the command's output stays clean.
write_init() {
    cat <<'EOF'
#!/bin/busybox sh
/bin/busybox --install -s /bin
export PATH=/bin
H=/host IO=/io

# Uptime on each line, so a kept console log shows where boot time goes.
say() { up=; read -r up _ </proc/uptime 2>/dev/null; echo "kernel-vm: [$up] $*"; }
finish() { sync; poweroff -f; }
fail() { say "$*"; echo "error $*" >"$IO/status" 2>/dev/null; finish; }

mount -t proc proc /proc && mount -t sysfs sys /sys && mount -t devtmpfs dev /dev || fail "cannot mount proc/sys/dev"
for m in $(cat /modules.order); do
    insmod "/modules/$m" || fail "module $m will not load"
done
# A large msize cuts the 9p round trips that dominate module loading.
P9=trans=virtio,version=9p2000.L,msize=262144
mount -t 9p -o "$P9" io "$IO" || fail "cannot mount the result share"
mount -t 9p -o "$P9,ro,cache=loose" hostroot "$H" || fail "cannot mount the host root"
say "9p mounted"
for d in proc sys dev; do mount --bind "/$d" "$H/$d" || fail "cannot bind /$d into the host root"; done
mount -t tmpfs tmp "$H/tmp" || fail "cannot mount a tmpfs on /tmp"
# What udev would add to /dev and host programs take for granted: the fd
# links (bash process substitution), POSIX shm and pseudo-terminals.
ln -s /proc/self/fd /dev/fd && ln -s fd/0 /dev/stdin && ln -s fd/1 /dev/stdout && ln -s fd/2 /dev/stderr
mkdir -p /dev/shm /dev/pts && mount -t tmpfs shm /dev/shm && mount -t devpts -o ptmxmode=0666 pts /dev/pts &&
    ln -sf pts/ptmx /dev/ptmx || fail "cannot set up /dev"

# Modules the kernel asks for on its own (the crypto the Bluetooth core
# needs) must come from the host's module tree too.
echo /modprobe-helper >/proc/sys/kernel/modprobe
say "modprobe bluetooth hci_vhci"
chroot "$H" /sbin/modprobe -a bluetooth hci_vhci || fail "module bluetooth or hci_vhci will not load"
[ -c /dev/vhci ] || fail "/dev/vhci did not appear"

. "$IO/params"
job=$(cat "$IO/job")
( sleep "$TIMEOUT"; echo timeout >"$IO/status"; finish ) &
watchdog=$!
say "command start"
chroot "$H" /usr/bin/env -i PATH=/usr/local/sbin:/usr/local/bin:/usr/sbin:/usr/bin:/sbin:/bin \
    HOME=/root LANG=C.UTF-8 /bin/bash -c "$job" </dev/null >"$IO/stdout" 2>"$IO/stderr"
rc=$?
kill "$watchdog"
echo "exit $rc" >"$IO/status"
say "command exit $rc"
finish
EOF
}

# Everything needed to mount 9p, in the order the dependencies must load.
ninep_modules() {
    local m
    for m in virtio_pci 9pnet_virtio 9p; do
        modprobe -S "$KVER" --show-depends "$m"
    done | awk '$1 == "insmod" && !seen[$2]++ { print $2 }'
}

# Cached by kernel version and this script's content, the only inputs.
build_initramfs() {
    local key out tmp m
    key=$(sha256sum "$SELF" | cut -c1-16)
    out="$CACHE/initramfs-$KVER-$key.cpio"
    if [[ ! -s $out ]]; then
        tmp=$(mktemp -d "$CACHE/build.XXXXXX")
        mkdir -p "$tmp"/{bin,dev,proc,sys,host,io,modules}
        cp /bin/busybox "$tmp/bin/busybox"
        mknod "$tmp/dev/console" c 5 1
        for m in $(ninep_modules); do
            cp "$m" "$tmp/modules/"
            basename "$m" >>"$tmp/modules.order"
        done
        write_init >"$tmp/init"
        printf '#!/bin/sh\nexec chroot /host /sbin/modprobe "$@"\n' >"$tmp/modprobe-helper"
        chmod 755 "$tmp/init" "$tmp/modprobe-helper"
        # Uncompressed: decompressing it under emulation would cost more than reading it.
        (cd "$tmp" && find . | busybox cpio -o -H newc 2>/dev/null) >"$tmp.cpio"
        rm -rf "$tmp"
        rm -f "$CACHE"/initramfs-*.cpio
        mv "$tmp.cpio" "$out"   # atomic, so a concurrent run never sees half a file
    fi
    echo "$out"
}

# The command as bash text that the VM runs in its chroot; printf %q keeps
# every argument and value exactly as given.
write_job() {
    local kv
    # Under /tmp the host path is hidden by the VM's own tmpfs; fall back to /.
    printf 'cd -- %q 2>/dev/null || cd /\n' "$PWD"
    for kv in "${ENVS[@]}"; do
        printf 'export %s=%q\n' "${kv%%=*}" "${kv#*=}"
    done
    echo "unset OLDPWD"
    printf 'exec'
    printf ' %q' "$@"
    printf '\n'
}

# VM_KEEP=1 keeps the logs of a run that went well, e.g. to time its boot.
drop_run() {
    if [[ ${VM_KEEP-} == 1 ]]; then echo "kernel-vm: kept $RUN" >&2; else rm -rf "$RUN"; fi
}

TIMEOUT=60
ENVS=()
while (($#)); do
    case $1 in
        --timeout) [[ ${2-} =~ ^[1-9][0-9]*$ ]] || usage; TIMEOUT=$2; shift 2 ;;
        --env)
            [[ ${2-} =~ ^[A-Za-z_][A-Za-z0-9_]*(=|$) ]] || usage
            if [[ $2 == *=* ]]; then ENVS+=("$2"); else ENVS+=("$2=${!2-}"); fi
            shift 2 ;;
        --) shift; break ;;
        *) usage ;;
    esac
done
(($#)) || usage

((EUID == 0)) || die "must run as root (installs packages, builds device nodes)"
mkdir -p "$CACHE"
install_missing
KVER=$(pick_kernel)
KERNEL=$(kernel_image)
INITRAMFS=$(build_initramfs)

RUN=$(mktemp -d "$CACHE/run.XXXXXX")
mkdir "$RUN/io"
echo "TIMEOUT=$TIMEOUT" >"$RUN/io/params"
write_job "$@" >"$RUN/io/job"

# The guest's own watchdog enforces TIMEOUT; this bound only catches a VM
# that never gets that far (a hang in boot or in module loading).
VM_BOUND=$((TIMEOUT + 120))
set +e
timeout -k 5 "$VM_BOUND" qemu-system-x86_64 \
    -accel tcg -nodefaults -no-user-config -display none -nic none \
    -m 512 -smp 1 -no-reboot \
    -kernel "$KERNEL" -initrd "$INITRAMFS" \
    -append "console=ttyS0 panic=-1 quiet" \
    -serial "file:$RUN/console.log" \
    -virtfs local,path=/,mount_tag=hostroot,security_model=none,readonly=on,multidevs=remap \
    -virtfs "local,path=$RUN/io,mount_tag=io,security_model=none" \
    </dev/null >"$RUN/qemu.log" 2>&1 &
vm=$!
# A caller that gives up on us must not leave a VM running behind.
trap 'kill "$vm" 2>/dev/null; die "interrupted"' INT TERM HUP
wait "$vm"
qrc=$?
trap - INT TERM HUP
set -e

status=$(cat "$RUN/io/status" 2>/dev/null || true)
[[ -f $RUN/io/stdout ]] && cat "$RUN/io/stdout"
[[ -f $RUN/io/stderr ]] && cat "$RUN/io/stderr" >&2
case $status in
    "exit "*) drop_run; exit "${status#exit }" ;;
    timeout) drop_run; echo "kernel-vm: command did not finish within $TIMEOUT s" >&2; exit 124 ;;
    "error "*) die "${status#error } (console log: $RUN/console.log)" ;;
esac
# No result at all: say the most specific thing the logs know.
((qrc == 124 || qrc == 137)) && die "VM did not finish within $VM_BOUND s (console log: $RUN/console.log)"
((qrc != 0)) && die "VM could not start: $(head -n1 "$RUN/qemu.log")"
why=$(grep -a -e "kernel-vm:" -e 'Kernel panic' "$RUN/console.log" | tail -n1)
die "VM ended without a result: ${why:-$(tail -n1 "$RUN/console.log")} (console log: $RUN/console.log)"
