# What the checks share. A check is a command; what it prints is shown when it fails.
passed=0 failed=0 skipped=0 pids=()
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
  printf '%s\0%s\0%s\0' "$name" COMPLETED "$output" >>"$results"
}
skip() { # name, why
  skipped=$((skipped + 1))
  echo "SKIP  $1: $2"
  printf '%s\0%s\0%s\0' "$1" SKIPPED "$2" >>"$results"
}
finish() { # report, seconds
  python3 - "$results" "$1" <<'PYTHON'
import json, pathlib, sys
words = pathlib.Path(sys.argv[1]).read_text(errors="replace").split("\0")[:-1]
def test(name, result, output):
    details = {"why_skipped": output} if result == "SKIPPED" else {"failures": [{"failure": output}]} if output else {}
    return {"name": name, "result": result, **details}
tests = [test(*check) for check in zip(words[::3], words[1::3], words[2::3])]
pathlib.Path(sys.argv[2]).write_text(json.dumps({"testsuites": [{"name": "Packages", "testsuite": tests}]}))
PYTHON
  rm -f "$results"
  echo "packages: $passed passed, $failed failed, $skipped skipped, in $2 s"
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
