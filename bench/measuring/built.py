"""Where the programs under measurement come from."""

import os
import subprocess

from measuring.program import Failure

ROOT = os.path.dirname(os.path.dirname(os.path.dirname(os.path.abspath(__file__))))
PROGRAMS = ["quarry", "fileindexd", "tarnelasticd", "tarncontentextractd", "tarnotifyd"]


def need_packages(*names):
    """Installs the Debian packages that are missing. Fails where that is not possible."""
    call = ". scripts/packages.sh && need_packages "
    if subprocess.run(["bash", "-c", call + '"$@"', "need", *names], cwd=ROOT,
                      check=False).returncode != 0:
        raise Failure("These packages cannot be installed: " + " ".join(names))


def release_programs(directory):
    """The directory of our programs: the one given, or that of the release build, brought up to
    date first."""
    if directory is None:
        _build()
        directory = os.path.join(ROOT, "build/release/bin")
    for name in PROGRAMS:
        if not os.access(os.path.join(directory, name), os.X_OK):
            raise Failure(f"{directory} has no program {name}. Name the bin directory of a build.")
    return os.path.abspath(directory)


def _build():
    need_packages(*subprocess.check_output(
        ["bash", "-c", '. scripts/packages.sh; echo "${build_packages[@]}"'], cwd=ROOT,
        text=True).split(), "libbenchmark-dev")
    for command in (["cmake", "--preset", "release"],
                    ["cmake", "--build", "--preset", "release", "--target", *PROGRAMS]):
        if subprocess.run(command, cwd=ROOT, check=False, stdout=2).returncode != 0:
            raise Failure("The release build failed: " + " ".join(command))
