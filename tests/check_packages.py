"""Makes the Debian packages of a build and looks at them: names, fields, dependencies and files.

usage: check_packages.py CPACK BUILD VERSION TRIPLET
"""
import pathlib
import re
import subprocess
import sys
import tempfile

cpack, build, version, triplet = sys.argv[1:]
HOSTS = ("memory", "posix", "stdio", "window")
ARCHITECTURES = {"x86_64-linux-gnu": "amd64", "arm-linux-gnueabihf": "armhf"}
LIB, DEV, DOC = f"usr/lib/{triplet}", "usr/include/flvdmx", "usr/share/doc/flvdmx"
EXPECTED = {
    "libflvdmx1": ("libs", "same", {"libc6"}, {f"{LIB}/libflvdmx.so.1", f"{LIB}/libflvdmx.so.1.0.0"}),
    "libflvdmx-dev": ("libdevel", "same", {f"libflvdmx1 (= {version}-1)"}, {
        f"{DEV}/flvdmx.h", f"{DEV}/flvdmx.hpp", *(f"{DEV}/{name}_host.h" for name in HOSTS), f"{LIB}/libflvdmx.so",
        f"{LIB}/libflvdmx-host.a", *(f"{LIB}/pkgconfig/{name}.pc" for name in ("flvdmx", "flvdmx-host")),
        *(f"{LIB}/cmake/flvdmx/flvdmx{name}.cmake" for name in (
            "Config", "ConfigVersion", "Targets", "Targets-release")), "usr/share/man/man3/QVX_FLV_DMX.3.gz",
        *(f"{DOC}/docs/{name}.md" for name in ("host-guide", "damage")),
        *(f"{DOC}/examples/{name}" for name in ("list.c", "copy_frames.c", "seek.cpp")),
        *(f"{DOC}/host/{name}" for name in ("adapter.h", "descriptor.h", "descriptor.cpp")),
        *(f"{DOC}/host/{name}_host.cpp" for name in HOSTS)}),
    "flvdmx-tools": ("video", "foreign", {f"libflvdmx1 (>= {version})", "libc6", "libstdc++6"}, {
        "usr/bin/flvdmx", "usr/share/man/man1/flvdmx.1.gz", "usr/share/bash-completion/completions/flvdmx"}),
}


def run(*command):
    return subprocess.run(command, check=True, stdout=subprocess.PIPE, text=True).stdout


def check(package, name):
    section, multiarch, depends, files = EXPECTED[name]
    fields = dict(re.findall(r"^(\S+): (.*)$", run("dpkg-deb", "-f", package), re.M))
    wanted = {"Package": name, "Version": f"{version}-1", "Section": section, "Architecture": ARCHITECTURES[triplet],
              "Multi-Arch": multiarch}
    assert wanted.items() <= fields.items(), fields
    found = fields["Depends"].split(", ")
    assert depends <= {*found, *(text.split(" (")[0] for text in found)}, found
    lines = run("dpkg-deb", "-c", package).splitlines()
    assert all(line.split()[1] == "root/root" for line in lines), lines
    doc = {f"usr/share/doc/{name}/{file}" for file in ("copyright", "NEWS.md")}
    paths = {line.split(" ./")[1].split(" -> ")[0] for line in lines if line[0] != "d"}
    assert paths == files | doc, paths ^ (files | doc)


with tempfile.TemporaryDirectory() as folder:
    run(cpack, "--config", f"{build}/CPackConfig.cmake", "-B", folder)
    packages = {path.name.split("_")[0]: path for path in pathlib.Path(folder).glob("*.deb")}
    assert packages.keys() == EXPECTED.keys(), packages
    for name, package in packages.items():
        check(package, name)
