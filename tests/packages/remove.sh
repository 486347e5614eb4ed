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
purges() { apt_in_root purge lumacastd liblumacast1 liblumacast-dev lumacast-tools lumacast-extensions; }
leaves_nothing() { ! paths | grep -i lumacast; }

before=$(sums)
check "a newer version installs" upgrades
check "the daemon that runs goes on, and the movies stay" eval 'runs_on && movies_stay'
check "removal removes the programs and keeps what the administrator set" eval 'removes && keeps_settings'
check "after it the movies are there" movies_stay
check "purge removes all" eval 'purges && leaves_nothing'
check "after that the movies are there too" movies_stay
