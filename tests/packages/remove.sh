# A newer version, removal and purge: the user's movies stay, all else goes.

newer() { # the same packages, with a higher version
  local package
  for package in build/packages/*.deb; do
    rm -rf "$root/packages/new"
    dpkg-deb -R "$package" "$root/packages/new"
    sed -i -E 's/^Version: (.*)/Version: \1+newer/; s/(liblumacast1 \(= [^)]*)\)/\1+newer)/' "$root/packages/new/DEBIAN/control"
    dpkg-deb --root-owner-group -Znone -b "$root/packages/new" "$root/packages" && rm "$root/packages/$(basename "$package")"
  done
  rm -rf "$root/packages/new"
}
upgrades() {
  newer && installs && [ "$(in_root dpkg-query -W -f '${Version}\n' lumacastd liblumacast1 liblumacast-dev lumacast-tools lumacast-extensions |
    grep -c '+newer$')" -eq 5 ]
}
sums() { (cd "$root/home/ann" && find . -name '*.mp4' -exec sha256sum {} + | sort); }
movies_stay() { [ -n "$before" ] && diff <(echo "$before") <(sums); }
runs_on() { as_ann lumacastctl status; }
removes() { apt_in_root remove lumacastd liblumacast1 liblumacast-dev lumacast-tools lumacast-extensions && [ ! -e "$root/usr/bin/lumacastd" ]; }
keeps_settings() { [ -e "$root/etc/lumacast/entitlements.d/lumacastctl.conf" ]; }
purges() { in_root dpkg --purge lumacastd liblumacast1 liblumacast-dev lumacast-tools lumacast-extensions; }
leaves_nothing() { ! paths | grep -i lumacast; }

before=$(sums)
check "a newer version installs" upgrades
check "the daemon that runs goes on, and the movies stay" eval 'runs_on && movies_stay'
check "removal removes the programs and keeps what the administrator set" eval 'removes && keeps_settings'
check "after it the movies are there" movies_stay
# The folders of the confined form, lumacastd@.service: one with a movie that its user has not saved, one without.
mkdir -p "$root/var/lib/lumacast/1000/root" "$root/var/lib/lumacast/1001/root"
cp "$root/home/ann/movie.mp4" "$root/var/lib/lumacast/1000/root/"
unsaved_stays() { [ -e "$root/var/lib/lumacast/1000/root/movie.mp4" ] && rm -r "$root/var/lib/lumacast/1000" && rmdir "$root/var/lib/lumacast"; }
check "purge keeps a folder with an unsaved movie, and no other" eval 'purges && unsaved_stays'
check "nothing else is left" leaves_nothing
check "and the movies are there" movies_stay

# The end of the session.
for pid in "${pids[@]}"; do kill "$pid" 2>/dev/null; done
for pid in "${pids[@]}"; do wait "$pid" 2>/dev/null; done
