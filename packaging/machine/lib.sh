# What the walk through the machine is made of. Sourced by run.

say() { printf '\n\033[1m==> %s\033[0m\n' "$*"; }
die() { printf 'machine: %s\n' "$*" >&2; exit 1; }

steps=0 failures=0
# check WORDS COMMAND...: one step of the walk. The words say what must hold.
check() {
  local words=$1 answer
  shift
  steps=$((steps + 1))
  if answer=$("$@" 2>&1); then
    printf 'ok      %s\n' "$words"
  else
    failures=$((failures + 1))
    printf 'FAILED  %s\n' "$words"
    printf '%s\n' "$answer" | tail -20 | sed 's/^/          | /'
  fi
}
# show COMMAND...: runs it in the machine, with what it prints in the transcript.
show() {
  printf '$ %s\n' "$*"
  inside "$@" 2>&1 | sed 's/^/  /' || true
}

# inside COMMAND...: runs it in the machine, as root.
inside() {
  nsenter -t "$init" -m -u -i -n -p -C -T -r -w env -i PATH=/usr/sbin:/usr/bin:/sbin:/bin HOME=/root \
    LANG=C.UTF-8 PYTHONDONTWRITEBYTECODE=1 DEBIAN_FRONTEND=noninteractive "$@"
}
inside_sh() { inside sh -c "$1"; }
property() { inside systemctl show -p "$2" --value "$1"; }

# until_true SECONDS COMMAND...: waits for a condition.
until_true() {
  local end=$((SECONDS + $1))
  shift
  until "$@" >/dev/null 2>&1; do
    [ $SECONDS -lt $end ] || return 1
    sleep 0.5
  done
}

# Real volumes: the root on one image, /var on another.
make_disks() {
  truncate -s 3G "$work/root.img"
  truncate -s 1G "$work/var.img"
  mkfs.ext4 -q -F "$work/root.img"
  mkfs.ext4 -q -F "$work/var.img"
}
mount_disks() {
  mkdir -p "$root"
  mount -o loop "$work/root.img" "$root"
  mkdir -p "$root/var"
  mount -o loop "$work/var.img" "$root/var"
}
unmount_disks() {
  umount -R "$root" 2>/dev/null || true
}

bootstrap() {
  if [ ! -e "$cache/base.done" ]; then
    rm -rf "$cache/base"
    debootstrap --variant=minbase --include="$packages" bookworm "$cache/base" "$mirror" >"$work/debootstrap.log" 2>&1 ||
      die "debootstrap failed; its log is $work/debootstrap.log"
    touch "$cache/base.done"
  fi
  cp -a "$cache/base/." "$root/"
  # They would look for news on the network.
  ln -sf /dev/null "$root/etc/systemd/system/apt-daily.timer"
  ln -sf /dev/null "$root/etc/systemd/system/apt-daily-upgrade.timer"
  # The kernel hands its audit records to the outside only.
  ln -sf /dev/null "$root/etc/systemd/system/systemd-journald-audit.socket"
}

# What installing needs is fetched before: the machine has no network.
fetch_dependencies() {
  mkdir -p "$root/srv/debs"
  cp "$out"/*.deb "$root/srv/debs/"
  rm -f "$root/srv/debs/"*dbgsym*
  cp /etc/resolv.conf "$root/etc/resolv.conf"
  chroot "$root" apt-get update -qq
  chroot "$root" sh -c 'apt-get install -y -qq -d --no-install-recommends /srv/debs/*.deb' >/dev/null
  # A cache of the package manager as machines have it.
  chroot "$root" apt-get install -y -qq -d --no-install-recommends $cached_packages >/dev/null
  rm -f "$root/etc/resolv.conf"
}

group=/sys/fs/cgroup/unified
[ -d "$group" ] || group=/sys/fs/cgroup

# start_machine SECONDS: boots it, with a boot clock that is so far ahead of the outside's.
start_machine() {
  local ahead=$1
  mkdir -p "$group/spacekeep-machine-$$"
  (
    echo "$BASHPID" > "$group/spacekeep-machine-$$/cgroup.procs"
    exec unshare --mount --pid --fork --kill-child --net --uts --ipc --cgroup \
      --time --boottime "$ahead" --monotonic "$ahead" "$here/boot" "$root" "$work/boot.log"
  ) &
  outer=$!
  until_true 20 has_init || die "the machine does not boot: $(cat "$work/boot.log")"
  until_true 180 is_up || die "the machine does not come up: $(inside systemctl list-jobs 2>&1)"
}
# The first process of the machine is unshare's child.
has_init() {
  init=$(cat "/proc/$outer/task/$outer/children" 2>/dev/null | awk '{print $1}')
  [ -n "$init" ] && [ "$(cat "/proc/$init/comm")" = systemd ]
}
is_up() { inside systemctl is-system-running | grep -qE '^(running|degraded)$'; }

stop_machine() {
  [ -n "${init:-}" ] || return 0
  inside systemctl poweroff >/dev/null 2>&1 || true
  until_true 60 test ! -e "/proc/$init" || kill -KILL "$init" 2>/dev/null || true
  wait "$outer" 2>/dev/null || true
  init=
  sync
  find "$group/spacekeep-machine-$$" -depth -type d -exec rmdir {} + 2>/dev/null || true
}

# fails COMMAND...: holds when the command does not succeed.
fails() { ! "$@"; }
