"""Makes the Debian packages of a build and checks their names, fields, dependencies and files.

usage: check_packages.py CPACK BUILD VERSION TRIPLET GSTREAMER

GSTREAMER is ON when the build has the plugin for it.
"""
import pathlib
import re
import subprocess
import sys
import tempfile

cpack, build, version, triplet, gstreamer = sys.argv[1:]
ARCHITECTURES = {"x86_64-linux-gnu": "amd64", "arm-linux-gnueabihf": "armhf"}
CONTENTS = pathlib.Path(__file__).resolve().parent.parent / "packaging" / "contents"
EXPECTED = {
    "libflvdmx1": ("libs", "same", {"libc6"}),
    "libflvdmx-dev": ("libdevel", "same", {f"libflvdmx1 (= {version}-1)"}),
    "flvdmx-tools": ("video", "foreign", {f"libflvdmx1 (>= {version})", "libc6", "libstdc++6"}),
}
if gstreamer == "ON":
    EXPECTED["gstreamer1.0-flvdmx"] = ("libs", "same", {f"libflvdmx1 (>= {version})", "libgstreamer1.0-0", "libc6"})


def run(*command):
    return subprocess.run(command, check=True, stdout=subprocess.PIPE, text=True).stdout


def check(package, name):
    section, multiarch, depends = EXPECTED[name]
    fields = dict(re.findall(r"^(\S+): (.*)$", run("dpkg-deb", "-f", package), re.M))
    wanted = {"Package": name, "Version": f"{version}-1", "Section": section, "Architecture": ARCHITECTURES[triplet],
              "Multi-Arch": multiarch}
    assert wanted.items() <= fields.items(), fields
    found = fields["Depends"].split(", ")
    assert depends <= {*found, *(text.split(" (")[0] for text in found)}, found
    lines = run("dpkg-deb", "-c", package).splitlines()
    assert all(line.split()[1] == "root/root" for line in lines), lines
    files = {*(CONTENTS / name).read_text().replace("TRIPLET", triplet).splitlines()}
    paths = {line.split(" ./")[1].split(" -> ")[0] for line in lines if line[0] != "d"}
    assert paths == files, paths ^ files


with tempfile.TemporaryDirectory() as folder:
    run(cpack, "--config", f"{build}/CPackConfig.cmake", "-B", folder)
    packages = {path.name.split("_")[0]: path for path in pathlib.Path(folder).glob("*.deb")}
    assert packages.keys() == EXPECTED.keys(), packages
    for name, package in packages.items():
        check(package, name)
