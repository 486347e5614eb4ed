"""Builds what a comparison needs."""

import pathlib
import shutil
import subprocess
import sys

ROOT = pathlib.Path(__file__).resolve().parents[2]


def build(targets):
    """Installs what is missing and builds for release; answers the folder of the programs."""
    subprocess.run([ROOT / "scripts/setup", "bench"], check=True)
    print("Building…", flush=True)
    directory = ROOT / "build/bench"
    configure = ["cmake", "--preset", "release", "-B", directory, "-DLC_TESTS=OFF"]
    if shutil.which("ccache"):
        configure.append("-DCMAKE_CXX_COMPILER_LAUNCHER=ccache")
    for command in (configure, ["cmake", "--build", directory, "--target", *targets]):
        done = subprocess.run(command, cwd=ROOT, stdout=subprocess.PIPE, stderr=subprocess.STDOUT, text=True)
        if done.returncode != 0:
            sys.exit("\n".join(done.stdout.splitlines()[-30:]))
    return directory / "bin"
