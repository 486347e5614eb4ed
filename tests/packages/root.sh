# The clean root, for those who are in mount and process namespaces of their own.
kept=$PWD/build/clean-root
root=$kept/root

packages() { for package in build/packages/*.deb; do dpkg-deb -f "$package" Package; done; }
enter() { # archive: the root as it was kept, the packages, and nothing of this machine but devices
  mount --make-rprivate /
  rm -rf --one-file-system "$root"
  mkdir -p "$root"
  tar -C "$root" -xf "$1"
  mount -t proc proc "$root/proc"
  mount --rbind /dev "$root/dev"
  for folder in run tmp dev/shm; do mount -t tmpfs -o mode=1777 tmpfs "$root/$folder"; done
  chmod 755 "$root/run"
  mkdir "$root/packages"
  cp build/packages/*.deb "$root/packages/"
  # No service is started by its package.
  printf '#!/bin/sh\nexit 101\n' >"$root/usr/sbin/policy-rc.d"
  chmod +x "$root/usr/sbin/policy-rc.d"
}
leave() { for folder in proc dev run tmp; do umount -R -l "$root/$folder"; done; }

in_root() { chroot "$root" /usr/bin/env -i PATH=/usr/sbin:/usr/bin:/sbin:/bin LANG=C.UTF-8 DEBIAN_FRONTEND=noninteractive "$@"; }
apt_in_root() {
  in_root apt-get -q -y --no-install-recommends -o Dpkg::Options::=--force-unsafe-io -o APT::Sandbox::User=root "$@"
}
installs() { apt_in_root install $(cd "$root" && ls packages/*.deb | sed 's|^|/|'); }
