#!/usr/bin/env python3
"""Fails when the modules of a source tree, or its folders, include each other in a circle.

A module is the header and the source files of one name ("list/sorted_list.h" and
"list/sorted_list.cpp"); it stands above every module whose header one of its files includes. A
folder stands above every folder whose modules one of its own modules includes; what lies in a folder
inside it counts for that one alone. With no circle both form a ladder, and each can be read and
tested on those below it alone.
"""

import pathlib
import re
import sys

INCLUDE = re.compile(r'^\s*#\s*include\s*"([^"]+)"', re.MULTILINE)
SUFFIXES = {".h", ".def", ".c", ".cc", ".cpp"}


def read_modules(root):
    """Gives, for each module, the modules it includes and the file that does."""
    modules = {}
    for file in sorted(root.rglob("*")):
        if file.suffix not in SUFFIXES:
            continue
        name = file.relative_to(root).with_suffix("").as_posix()
        included = modules.setdefault(name, {})
        for path in INCLUDE.findall(file.read_text(encoding="utf-8")):
            # By path from the root, else beside the file; generated headers are neither.
            for target in (root / path, file.parent / path):
                if target.is_file():
                    target = target.resolve().relative_to(root).with_suffix("").as_posix()
                    if target != name:
                        included.setdefault(target, file.relative_to(root).as_posix())
                    break
    return modules


def folders_of(modules):
    """Gives, for each folder, the folders it includes and the file that does."""
    folders = {}
    for name, included in modules.items():
        folder = str(pathlib.PurePosixPath(name).parent)
        above = folders.setdefault(folder, {})
        for target, file in included.items():
            below = str(pathlib.PurePosixPath(target).parent)
            if below != folder:
                above.setdefault(below, file)
    return folders


def find_circle(modules):
    """Gives one circle as a list of names whose last is its first again, or None."""
    finished = set()

    def visit(name, path):
        if name in path:
            return path[path.index(name):] + [name]
        if name in finished:
            return None
        for included in modules[name]:
            circle = visit(included, path + [name])
            if circle:
                return circle
        finished.add(name)
        return None

    for name in modules:
        circle = visit(name, [])
        if circle:
            return circle
    return None


def main():
    if len(sys.argv) != 2:
        sys.exit("usage: check_includes.py FOLDER")
    root = pathlib.Path(sys.argv[1]).resolve()
    modules = read_modules(root)
    if not modules:
        sys.exit(f"{root} holds no source files")
    folders = folders_of(modules)
    for kind in (modules, folders):
        circle = find_circle(kind)
        if circle:
            print("The includes run in a circle:", file=sys.stderr)
            for upper, lower in zip(circle, circle[1:]):
                print(f"  {upper} includes {lower} (in {kind[upper][lower]})", file=sys.stderr)
            sys.exit(1)
    includes = sum(map(len, modules.values()))
    print(f"{len(modules)} modules in {len(folders)} folders, {includes} includes, no circle")


if __name__ == "__main__":
    main()
