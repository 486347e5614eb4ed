# What the checks share. A check is a command; what it prints is shown when it fails.
passed=0 failed=0 pids=()
results=$(mktemp)

check() { # name, command…
  local name=$1 output from=$SECONDS
  shift
  if output=$("$@" 2>&1); then
    passed=$((passed + 1))
    echo "PASS  $name ($((SECONDS - from)) s)"
    output=
  else
    failed=$((failed + 1))
    echo "FAIL  $name: $*"
    tail -n 25 <<<"$output" | sed 's/^/      /'
    [ -n "$output" ] || output="failed, and said nothing"
  fi
  printf '%s\0%s\0' "$name" "$output" >>"$results"
}
finish() { # report, seconds
  python3 - "$results" "$1" <<'PYTHON'
import json, pathlib, sys
words = pathlib.Path(sys.argv[1]).read_text(errors="replace").split("\0")[:-1]
tests = [{"name": name, "result": "COMPLETED", **({"failures": [{"failure": output}]} if output else {})}
         for name, output in zip(words[::2], words[1::2])]
pathlib.Path(sys.argv[2]).write_text(json.dumps({"testsuites": [{"name": "Packages", "testsuite": tests}]}))
PYTHON
  rm -f "$results"
  echo "packages: $passed passed, $failed failed, in $2 s"
  exit $((failed > 0))
}
wait_for() { # seconds, command…
  local limit=$((SECONDS + $1))
  shift
  until "$@"; do
    [ $SECONDS -lt $limit ] || { echo "waited in vain for: $*"; return 1; }
    sleep 0.05
  done
}

# An ordinary user of that root, with nothing but what a session gives.
session=(HOME=/home/ann USER=ann LANG=C.UTF-8 PATH=/usr/local/bin:/usr/bin:/bin XDG_RUNTIME_DIR=/run/user/1000 DISPLAY=:7)
ann=(chroot --userspec=ann:ann "$root" /usr/bin/env -i "${session[@]}")
as_ann() { "${ann[@]}" "$@"; }
