# The commands that pages show, taken out of the pages and run as they stand. tests/docs looks for these calls: what a page shows
# of the system's programs is run here.

shown() { # page, how the command line begins: the one line that does, with what it goes on in
  python3 - "$1" "$2" <<'PYTHON'
import pathlib, re, sys
page, begin = sys.argv[1:]
text = re.sub(r"\\\n *", "", pathlib.Path(page).read_text())
is_code, found = False, set()
for line in text.split("\n"):
    if line.startswith("```"):
        is_code = not is_code
    elif (is_code or line.startswith("    ")) and line.strip().removeprefix("$ ").startswith(begin):
        found.add(line.strip().removeprefix("$ "))
if len(found) != 1:
    sys.exit(f"{page} shows {len(found)} commands that begin with {begin}")
print(found.pop())
PYTHON
}
ann_runs() { # page, beginning[, folder]
  local line
  line=$(shown "$1" "$2") || return
  as_ann sh -c "cd ${3:-/home/ann} && $line"
}
root_runs() {
  local line
  line=$(shown "$1" "$2") || return
  in_root sh -c "$line"
}
here_runs() { # in this tree
  local line
  line=$(shown "$1" "$2") && sh -c "$line"
}
# For one that goes on until it is stopped: a line that it prints has these words.
until_seen() { grep -q -m 1 "$1" < <(shift && "$@"); }
