# Installation: the packages bring all that they need.

paths() {
  (cd "$root" && find . -xdev \( -path ./home -o -path ./packages -o -path ./var/log -o -path ./var/cache/apt -o -path ./var/lib/dpkg \
    -o -path ./usr/local/bin \) -prune -o -print)
}
finds_its_libraries() {
  local program missing
  for program in /usr/bin/lumacastd /usr/bin/lumacastctl /usr/libexec/lumacast/lumacast-catalog \
    /usr/libexec/lumacast/lumacast-extension-launcher /usr/share/lumacast/extensions/hls-clips/hls-clips \
    /usr/share/lumacast/extensions/live-push/live-push /usr/lib/*/liblumacast.so.1; do
    missing=$(in_root sh -c "ldd $program" | grep 'not found') && { echo "$program: $missing"; return 1; }
    [ -e "$(echo "$root"$program)" ] || { echo "$program isn't there"; return 1; }
  done
}
is_enabled() { [ -L "$root/etc/systemd/user/sockets.target.wants/lumacastd.socket" ]; }
verifies_units() {
  local said
  said=$(as_ann systemd-analyze --user --man=no verify /usr/lib/systemd/user/lumacastd.socket /usr/lib/systemd/user/lumacastd.service 2>&1) &&
    [ -z "$said" ] || { echo "$said"; return 1; }
}

# In a root that has what they depend on, and nothing more.
enter "$kept/needed.tar"
check "the packages install with what they depend on" installs
check "every program finds its libraries" finds_its_libraries
check "the socket is enabled for all users' managers" is_enabled
# From here on in one that also has what the checks need.
leave
enter "$kept/with-tools.tar"
installs >/dev/null 2>&1
in_root useradd --create-home --shell /bin/sh ann
mkdir -p "$root/run/user/1000"
chown 1000:1000 "$root/run/user/1000"
chmod 700 "$root/run/user/1000"
check "the service manager understands the user's units" verifies_units
