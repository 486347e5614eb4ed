# The units as a real service manager takes them: both forms, from installation to removal, in a machine of the clean root.

of_user() { as_ann systemctl --user show --value -p "$1" lumacastd.service; }
of_system() { in_root systemctl show --value -p "$1" lumacastd@1000; }
is() { # expected, command…
  local expected=$1 found
  shift
  found=$("$@")
  [ "$found" = "$expected" ] || { echo "$*: $found, not $expected"; return 1; }
}
becomes() { wait_for 30 eval "is '$1' ${*:2} >/dev/null" || { is "$@"; daemon_says; return 1; }; }

installs_there() { rm "$root/usr/sbin/policy-rc.d" && in_root systemctl start user@1000 && installs; }
begins_at_once() {
  ann_runs debian/lumacastd.README.Debian 'systemctl --user daemon-reload' &&
    is active as_ann systemctl --user is-active lumacastd.socket
}
logs_in_anew() { in_root systemctl stop user@1000 && in_root systemctl start user@1000; }
waits_behind_its_socket() {
  logs_in_anew && is active as_ann systemctl --user is-active lumacastd.socket && is inactive of_user ActiveState &&
    is 0 of_user MainPID
}
starts_with_the_first_connection() {
  as_ann lumacastctl status && is active of_user ActiveState && is notify of_user Type && is Idle. of_user StatusText
}
shows_itself() {
  ann_runs docs/on-a-device.md 'systemctl --user status' | tee /dev/stderr | grep -q 'Status: "Idle."' &&
    until_seen 'lumacastd Starting!' ann_runs docs/on-a-device.md 'journalctl --user'
}
asked_makes_a_stream() { answer_yes && makes_a_stream && was_asked; }
has_a_session() { # what a desktop's session tells the user's manager
  as_ann mkdir -p /home/ann/.config/systemd/user
  printf '[Unit]\nBindsTo=graphical-session.target\n' >"$root/home/ann/.config/systemd/user/session.target"
  as_ann systemd-run --user --quiet --unit=display Xvfb :7 -noreset -screen 0 1280x800x24 -nolisten tcp &&
    wait_for 60 in_machine test -S /tmp/.X11-unix/X7 && wait_for 60 in_machine test -S /run/user/1000/pulse/native &&
    as_ann systemctl --user import-environment DISPLAY && as_ann systemctl --user daemon-reload &&
    as_ann systemctl --user start session.target
}
begins_anew() { ann_runs docs/on-a-device.md 'systemctl --user restart' && as_ann lumacastctl status; }
ends_with_the_session() {
  is active of_user ActiveState && as_ann systemctl --user stop graphical-session.target session.target &&
    becomes inactive of_user ActiveState && is success of_user Result && is 0 of_user ExecMainStatus &&
    as_ann systemctl --user start session.target
}
starts_anew_when_killed() { # of_user | of_system
  local before
  before=$($1 MainPID) && [ "$before" -gt 1 ] && in_root kill -KILL "$before" && becomes 1 "$1" NRestarts &&
    becomes active "$1" ActiveState && [ "$before" != "$($1 MainPID)" ] && as_ann lumacastctl status
}
is_not_started_beside_another() {
  ! in_root systemctl start lumacastd@1000 && is failed of_system ActiveState && is 69 of_system ExecMainStatus &&
    is 0 of_system NRestarts && in_root systemctl reset-failed lumacastd@1000 && as_ann lumacastctl status
}
begins_a_long_recording() { # of_user | of_system
  answer_yes
  as_ann systemd-run --user --quiet --wait --collect --unit=recording \
    lumacastctl record --display --output /home/ann/long.mp4 >"$kept/recording.log" 2>&1 &
  recording=$!
  was_asked && becomes Recording. "$1" StatusText || { cat "$kept/recording.log"; return 1; }
}
plays() { # movie: all of it
  local length
  ffmpeg -v error -i "$1" -f null - && length=$(ffprobe -v error -show_entries format=duration -of csv=p=0 "$1") &&
    echo "$1: $length s" && [[ $length =~ [1-9] ]]
}
closes_its_movie_when_stopped() { # of_user | of_system, stopping…
  local of=$1 movies=$root$state/root/private/var/mobile/Library/Lumacast
  begins_a_long_recording "$of" && "${@:2}" && is inactive "$of" ActiveState && is success "$of" Result &&
    is 0 "$of" ExecMainStatus && ! wait "$recording" && plays "$(ls -t "$movies"/ScreenRecording_*.mp4 | head -n 1)"
}
settles_the_system_form() { # as the page says
  printf 'DISPLAY=:7\nXDG_VIDEOS_DIR=/home/ann/Videos\n' >"$root/etc/lumacast/environment"
  local drop_in
  drop_in=$root$(sed -n "1s/^# A user's drop-in: //p" packaging/systemd/user.conf) && mkdir -p "$(dirname "$drop_in")" &&
    cp packaging/systemd/user.conf "$drop_in" && in_root systemctl daemon-reload
}
starts_the_system_form() {
  settles_the_system_form && root_runs docs/on-a-device.md 'systemctl enable' && is active of_system ActiveState &&
    ann_runs debian/lumacastd.README.Debian 'systemctl --user stop' &&
    root_runs debian/lumacastd.README.Debian 'systemctl enable' && is Idle. of_system StatusText &&
    is user-1000.slice of_system Slice && as_ann lumacastctl status
}
has_folders_of_its_own() {
  is '700 ann' in_root stat -c '%a %U' /var/lib/lumacast/1000 && is '700 ann' in_root stat -c '%a %U' /var/cache/lumacast/1000
}
shows_itself_in_the_system() {
  root_runs docs/on-a-device.md 'systemctl status' | tee /dev/stderr | grep -q 'Status: "Idle."' &&
    until_seen 'lumacastd Starting!' root_runs docs/on-a-device.md 'journalctl -u'
}
# What the kernel lets a process in the service's group open: not its own log, which is a device.
opens() { in_root sh -c "echo \$\$ >/sys/fs/cgroup/$1/cgroup.procs && exec 3<$2"; }
has_no_other_devices() {
  local group log=/dev/log-of-the-kernel
  group=$(of_system ControlGroup) && in_root mknod $log c 1 11 && opens init.scope $log && opens "$group" /dev/zero &&
    ! opens "$group" $log
}
comes_and_goes_with_the_user() {
  is active of_system ActiveState && in_root systemctl stop user@1000 && is inactive of_system ActiveState &&
    is 0 of_system ExecMainStatus && in_root systemctl start user@1000 && becomes active of_system ActiveState &&
    is inactive as_ann systemctl --user is-active lumacastd.socket && has_a_session
}
goes_on_while_upgraded() {
  local before
  in_root systemctl start lumacastd@1000 && begins_a_long_recording of_system && before=$(of_system MainPID) && upgrades &&
    is "$before" of_system MainPID && is Recording. of_system StatusText &&
    as_ann systemctl --user kill -s INT recording.service && wait "$recording" &&
    plays "$root/home/ann/long.mp4"
}
is_stopped_by_removal() {
  is active of_system ActiveState && removes && is inactive of_system ActiveState &&
    ! in_root sh -c 'cat /proc/[0-9]*/comm' | grep -x lumacastd
}
is_gone_after_purge() {
  local kept="$root/var/lib/lumacast/1000/lumacast/root"
  rm -r "$root"/etc/systemd/system/lumacastd@1000.service.d "$root/etc/lumacast/environment"  # the administrator's own
  purges && [ -n "$(find "$kept" -name '*.mp4')" ] && rm -r "$root/var/lib/lumacast" && in_root systemctl daemon-reload &&
    logs_in_anew && ! in_root systemctl list-units --all --no-legend | grep lumacast &&
    ! as_ann systemctl --user list-units --all --no-legend | grep lumacast && leaves_nothing
}

if may_have_a_machine; then
  starts_a_machine
  check "a service manager of its own boots in the clean root" boots
  moves_in
  check "the packages install while it runs" installs_there
  check "the user's socket can be opened at once, as their README says" begins_at_once
  check "after the next login it waits there, and no daemon runs" waits_behind_its_socket
  check "the first connection starts the daemon, which says when it is ready" starts_with_the_first_connection
  check "its status and its lines are shown by the commands of the page" shows_itself
  check "a session brings a display and a sound server" has_a_session
  check "a daemon that was woken before that is started anew, with the page's command" begins_anew
  check "a recording under the user's manager" records /home/ann/user.mp4 as_ann /home/ann/.local/bin/recorder /home/ann/user.mp4
  check "a broadcast through an extension in its sandbox, there" asked_makes_a_stream
  check "killed, the daemon is started anew" starts_anew_when_killed of_user
  check "it ends with the graphical session" ends_with_the_session
  check "another one for the same user ends, and is not started anew" is_not_started_beside_another
  check "stopped, it closes its movie and leaves in peace" closes_its_movie_when_stopped of_user ann_runs docs/on-a-device.md 'systemctl --user stop'
  state=/var/lib/lumacast/1000/lumacast
  check "the confined form starts as the page says" starts_the_system_form
  check "it has folders of its own" has_folders_of_its_own
  check "its status and lines are shown too" shows_itself_in_the_system
  check "a recording under it" records /home/ann/system.mp4 as_ann /home/ann/.local/bin/recorder /home/ann/system.mp4
  check "one of the display, saved to the Videos folder, which a drop-in names" records_the_display
  check "a broadcast through an extension in its sandbox, within the confinement" asked_makes_a_stream
  check "the kernel gives it no other devices" has_no_other_devices
  check "killed, it is started anew" starts_anew_when_killed of_system
  check "it comes and goes with its user, whose socket stays away" comes_and_goes_with_the_user
  check "stopped, it closes its movie too" closes_its_movie_when_stopped of_system in_root systemctl stop lumacastd@1000
  check "a newer version installs while it records, and it goes on" goes_on_while_upgraded
  check "removal stops it" is_stopped_by_removal
  check "purge leaves nothing in either manager" is_gone_after_purge
  check "the machine halts, and leaves nothing" halts
else
  skip "a service manager of its own" "$why_no_machine"
fi
