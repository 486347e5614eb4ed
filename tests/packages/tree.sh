# An installation without packages, by the commands of packaging's page: the same files.

# Names alone; what makes packages adds its own.
of_packages() {
  for package in build/packages/*.deb; do dpkg-deb --fsys-tarfile "$package" | tar -t; done |
    grep -v '/$\|/changelog\|/copyright$\|README.Debian\|/lintian/' | sed 's/^\.//; s/\.gz$//' | sort
}
of_the_tree() { (cd build/packages/tree && find . ! -type d | sed 's/^\.//' | sort); }
installs_the_same() {
  DESTDIR=$PWD/build/packages/tree here_runs packaging/README.md 'cmake --preset' && diff <(of_packages) <(of_the_tree)
}
check "what is installed without packages is the same" installs_the_same
rm -rf build/packages/tree
