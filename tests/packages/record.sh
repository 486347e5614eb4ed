# Use: a display, a sound server and the socket as a session has them; then what a stranger would try.

movies=$root/home/ann/Videos/Lumacast
socket=$(sed -n 's/^ListenStream=//p' "$root/usr/lib/systemd/user/lumacastd.socket" 2>/dev/null)
socket=${socket/\%t/\/run\/user\/1000}

start_session() {
  "${ann[@]}" Xvfb :7 -noreset -screen 0 1280x800x24 -nolisten tcp >"$root/tmp/display.log" 2>&1 &
  pids+=($!)
  "${ann[@]}" pulseaudio -n --daemonize=no --exit-idle-time=-1 --disallow-exit --use-pid-file=no \
    -L "module-null-sink sink_name=null0 rate=48000 norewinds=1" -L "module-native-protocol-unix" >"$root/tmp/sound.log" 2>&1 &
  pids+=($!)
  mkdir -m 700 "$root/run/user/1000/lumacast"
  chown 1000:1000 "$root/run/user/1000/lumacast"
  # What the user's manager does with the two units: it opens the socket, and starts the daemon, confined, when somebody connects.
  # (The program that applies the service unit wants a user named, even if that is the one it already has.)
  cp "$confine" "$root/usr/local/bin/confine"
  printf '[Service]\nUser=1000\n' >"$root/home/user.conf"
  printf 'Environment=%s\n' "${session[@]}" >>"$root/home/user.conf"
  "${ann[@]}" systemd-socket-activate --listen="$socket" --fdname=lumacastd.socket "${session[@]/#/--setenv=}" \
    confine --unit /usr/lib/systemd/user/lumacastd.service --drop-in /home/user.conf --instance 1000 --program /usr/bin/lumacastd \
    >"$root/tmp/daemon.log" 2>&1 &
  pids+=($!)
}
session_is_there() {
  wait_for 60 test -S "$root/tmp/.X11-unix/X7" && wait_for 60 test -S "$root/run/user/1000/pulse/native" &&
    wait_for 60 test -S "$root$socket"
}
wakes_it() { ! grep -q Starting "$root/tmp/daemon.log" && as_ann lumacastctl status && grep -q 'lumacastd Starting!' "$root/tmp/daemon.log"; }
all_is_well() { as_ann lumacastctl doctor | tee "$root/tmp/doctor.txt" && [ -s "$root/tmp/doctor.txt" ] && ! grep -v '^ok' "$root/tmp/doctor.txt"; }
builds_with_cmake() { # as the pages show it, in the installed example
  as_ann cp -r /usr/share/doc/liblumacast-dev/examples /home/ann/project &&
    ann_runs docs/record-your-application.md 'cmake -B build' /home/ann/project &&
    ann_runs docs/write-an-upload-extension.md 'cmake -B build' /home/ann/project &&
    ann_runs docs/write-an-upload-extension.md 'ls ' | grep manifest.json && as_ann rm -r /home/ann/project/build
}
builds_with_make() { as_ann sh -c 'cd ~/project && make CXXFLAGS="-O0 -Wall -Wextra -Werror" PREFIX=$HOME/made install'; }
headers_stand_alone() {
  as_ann sh -c 'cd /usr/include/lumacast && for header in $(find . -name "*.h" | cut -c 3-); do
    echo "#include \"$header\"" | g++ -std=c++20 -Wall -Wextra -Werror -fsyntax-only -x c++ $(pkg-config --cflags lumacast) - || exit; done'
}
daemon_says() { tail -n 20 "$root/tmp/daemon.log"; }
answer_yes() { DISPLAY=:7 "$click_button" default --wait 60 >"$root/tmp/click.log" 2>&1 & clicker=$!; }
was_asked() { wait "$clicker" || { cat "$root/tmp/click.log"; return 1; }; }  # and the answer was given
has_colours() { # movies… : red, then green, then blue, in this order, each for a while
  for movie in "$@"; do
    ffmpeg -v error -i "$movie" -an -vf 'fps=10,scale=1:1' -pix_fmt rgb24 -f rawvideo - || return
  done | python3 -c '
import itertools, sys
data = sys.stdin.buffer.read()
names = ["rgb"[max(range(3), key=lambda at: data[i + at])] if max(data[i:i + 3]) > 150 and min(data[i:i + 3]) < 100 else "-"
         for i in range(0, len(data) - 2, 3)]
runs = [(name, len(list(run))) for name, run in itertools.groupby(name for name in names if name != "-")]
print("tenths of a second:", runs)
sys.exit([name for name, length in runs] != ["r", "g", "b"] or min(length for name, length in runs) < 4)'
}
records() { # movie, what makes it…
  answer_yes
  "${@:2}" || { cat "$root/tmp/click.log"; daemon_says; return 1; }
  was_asked && has_colours "$root$1"
}
records_again() { as_ann "$1" "$2" && has_colours "$root$2"; }
answers_on_its_socket() {
  ann_runs docs/on-a-device.md 'printf' | grep '"sessions"' && ann_runs linux/admin/README.md 'printf' | grep '"sessions"'
}
heeds_a_preference() {
  root_runs docs/on-a-device.md 'mkdir ' && root_runs docs/on-a-device.md 'echo ' && as_ann lumacastctl doctor | grep "LCFullResCapture=.*full size" &&
    rm -r "$root/etc/xdg/lumacast"
}
state=/home/ann/.local/state/lumacast
broadcasts() { # extension, directory below its own
  rm -rf "$root$state/extension-data/$1/$2"
  as_ann mkdir -p "$state/extension-data/$1/$2"
  as_ann /home/ann/.local/bin/broadcaster "$1" "$state/extension-data/$1/$2" ||
    { daemon_says; return 1; }
}
keeps_clips() {
  answer_yes
  broadcasts org.example.clip-keeper clips && was_asked &&
    has_colours $(ls -v "$root$state"/extension-data/org.example.clip-keeper/clips/clip-*.mp4)
}
makes_a_stream() {
  local stream=$root$state/extension-data/org.lumacast.hls-clips/stream
  broadcasts org.lumacast.hls-clips stream && wait_for 60 grep -q EXT-X-ENDLIST "$stream/index.m3u8" && has_colours "$stream/index.m3u8"
}
records_the_display() {
  local before
  before=$(ls "$movies" 2>/dev/null | wc -l)
  answer_yes
  as_ann lumacastctl record --display --duration 2 || { cat "$root/tmp/click.log"; daemon_says; return 1; }
  was_asked && [ "$(ls "$movies"/*.mp4 | wc -l)" -eq $((before + 1)) ] && ffprobe -v error "$(ls -t "$movies"/*.mp4 | head -n 1)"
}
saves() { as_ann lumacastctl save /home/ann/again.mp4 && [ "$(ls "$movies"/*.mp4 | wc -l)" -eq 2 ]; }

start_session
check "a display, a sound server and the daemon's socket are there" session_is_there
check "lumacastctl wakes the daemon that waits behind its socket" wakes_it
check "lumacastctl doctor finds all well" all_is_well
check "every public header stands alone" headers_stand_alone
check "applications and an extension build with CMake against the packages" builds_with_cmake
check "and with make and pkg-config" builds_with_make
check "an application records itself after the user has agreed" \
  records /home/ann/movie.mp4 ann_runs docs/record-your-application.md '$HOME/.local/bin/recorder'
check "it does so again" records_again /home/ann/.local/bin/recorder /home/ann/again.mp4
check "a broadcast goes through the extension that was built" keeps_clips
check "a broadcast goes through an installed extension" makes_a_stream
check "lumacastctl may record the whole display" records_the_display
check "lumacastctl saves a movie to the Videos folder" saves
check "the administrator's socket answers what the pages ask" answers_on_its_socket
check "a preference that is set as the page says counts" heeds_a_preference
