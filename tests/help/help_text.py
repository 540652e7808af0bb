"""What the programs tell of themselves by --help."""

import re
import subprocess


def run(arguments):
    return subprocess.run(
        arguments, capture_output=True, text=True, timeout=20, stdin=subprocess.DEVNULL
    )


def section(text, title):
    """The entries of a section: the lines that are indented by two."""
    found = re.search(rf"^{title}:\n((?:  .*\n)+)", text, re.MULTILINE)
    return re.findall(r"^  (\S+)", found[1], re.MULTILINE) if found else []


def option_names(entries):
    return {name for entry in entries for name in entry.split(",")}


def commands(program, path=()):
    """{command: (options, arguments)} of a tool; the tool itself is the command ""."""
    text = run([program, *path, "--help"]).stdout
    subcommands = section(text, "Subcommands")
    options = option_names(section(text, "Options"))
    arguments = set(section(text, "Positionals"))
    # A command that is nothing but the start of others has no entry of its own.
    found = {}
    if not path or not subcommands or arguments:
        found[" ".join(path)] = (options - ({"-h", "--help"} if path else set()), arguments)
    for name in subcommands:
        found |= commands(program, (*path, name))
    return found
