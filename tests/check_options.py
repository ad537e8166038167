"""Compares the manual page and the completion with the program's --help: commands and long options.

usage: check_options.py PROGRAM MANUAL COMPLETION
"""
import pathlib
import re
import subprocess
import sys

program, manual, completion = sys.argv[1:]
TOP = ""


def read(path):
    return pathlib.Path(path).read_text(encoding="utf-8")


def help_of(*command):
    return subprocess.run([program, *command, "--help"], check=True, stdout=subprocess.PIPE, text=True).stdout


def from_help():
    commands = re.findall(r"^  (\w+)  ", help_of().split("Commands:")[1], re.M)
    texts = {TOP: help_of(), **{command: help_of(command) for command in commands}}
    return {name: set(re.findall(r"^  (?:-\w,)?(--[\w-]+)", text, re.M)) for name, text in texts.items()}


def from_manual():
    first, *sections = re.split(r"^\.Ss (\w+).*\n", read(manual).split(".Sh THE DRAWING")[0], flags=re.M)
    texts = {TOP: first, **dict(zip(sections[::2], sections[1::2]))}
    items = {name: " ".join(re.findall(r"^\.It (Fl .*)", text, re.M)) for name, text in texts.items()}
    return {name: {"--help", *("--" + option for option in re.findall(r"Fl Fl ([\w-]+)", text))}  # --help: only once
            for name, text in items.items()}


def from_completion():
    lines = re.findall(r'^ +\[(\w+)\]="(.*)"$', read(completion), re.M)
    top = re.search(r'options\[\*\]\} (.*?)"', read(completion)).group(1)
    return {TOP: set(top.split()), **{name: set(options.split()) for name, options in lines}}


expected = from_help()
assert len(expected) > 1 and all("--help" in options for options in expected.values()), expected
for path, found in ((manual, from_manual()), (completion, from_completion())):
    differ = {name: expected.get(name, set()) ^ found.get(name, set()) for name in {*expected, *found}}
    assert found == expected, (path, differ)
