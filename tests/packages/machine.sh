# A machine of the clean root, with a service manager of its own, in which packages and units are what they are for a user.

# Whether this kernel lets us have one; if not, `why_no_machine` says why.
may_have_a_machine() {
  mkdir -p "$kept/cgroup"
  mount -t cgroup2 cgroup2 "$kept/cgroup" 2>/dev/null || { why_no_machine="no cgroup2 file system can be mounted here"; return 1; }
  # A group of its own below the one that we are in. The machine sees nothing above it.
  machine_group=$(mktemp -d "$kept/cgroup$(sed -n 's/^0:://p' /proc/self/cgroup)/lumacast-packages.XXXXXX" 2>/dev/null) ||
    { why_no_machine="no cgroup can be made here"; return 1; }
  chmod 755 "$machine_group"  # users' managers have groups below it
}
starts_a_machine() {
  (echo "$BASHPID" >"$machine_group/cgroup.procs" &&
    exec unshare --mount --pid --cgroup --uts --fork --kill-child -- tests/packages/boot "$root") >"$kept/boot.log" 2>&1 &
  machine=$!
}
manager() { cat "/proc/$machine/task/$machine/children"; }
boots() {
  wait_for 60 eval '[ -S "/proc/$(echo $(manager))/root/run/systemd/private" ]' &&
    in_machine systemctl is-system-running --wait | grep 'running\|degraded' && in_machine systemctl is-active multi-user.target ||
    { cat "$kept/boot.log"; in_machine systemctl --failed --no-pager; in_machine systemctl --no-pager list-jobs; return 1; }
}
in_machine() {
  nsenter -t $(manager) -m -p -u -C -r -w -- /usr/bin/env -i PATH=/usr/sbin:/usr/bin:/sbin:/bin LANG=C.UTF-8 \
    DEBIAN_FRONTEND=noninteractive "$@"
}
# From here on the other checks' functions act in the machine.
moves_in() {
  in_root() { in_machine "$@"; }
  ann=(in_machine setpriv --reuid=1000 --regid=1000 --init-groups -- /usr/bin/env -i "${session[@]}")
  daemon_says() { in_machine journalctl --no-pager -n 25 _COMM=lumacastd; }
}
halts() {
  in_machine systemctl poweroff
  wait_for 60 eval '! kill -0 "$machine"' && leaves_no_group
}
leaves_no_group() {
  wait_for 20 eval '! grep -q "populated 1" "$machine_group/cgroup.events"' && find "$machine_group" -depth -type d -exec rmdir {} +
}
ends_at_once() { # whatever has happened
  [ -z "${machine:-}" ] || kill -KILL "$machine" 2>/dev/null  # and its service manager with it
  [ ! -d "${machine_group:-}" ] || leaves_no_group
}
