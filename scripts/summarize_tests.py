#!/usr/bin/env python3
"""Counts what the test binaries reported (GoogleTest JSON) and prints the closing lines; fails when nothing ran."""
import json
import pathlib
import sys

passed = failed = skipped = 0
for path in sorted(pathlib.Path(sys.argv[1]).glob("*.json")):
    for suite in json.loads(path.read_text())["testsuites"]:
        for test in suite["testsuite"]:
            name = f"{path.stem}: {suite['name']}.{test['name']}"
            if test.get("failures"):
                failed += 1
                print(f"FAILED   {name}")
            elif test.get("result") == "SKIPPED":
                skipped += 1
                print(f"skipped  {name}: {test.get('why_skipped', 'no reason given')}")
            elif test.get("result") == "COMPLETED":
                passed += 1
for path in sorted(pathlib.Path(sys.argv[1]).glob("*.crashed")):
    failed += 1
    print(f"FAILED   {path.stem} ended without a report")
print(f"{passed} passed, {failed} failed, {skipped} skipped")
sys.exit(1 if failed or passed == 0 else 0)
