"""What the check_* scripts share: the tree's files, C++ text without comments, and the report."""

import argparse
import pathlib
import re
import subprocess
import sys

SOURCE_SUFFIXES = {".h", ".cpp", ".c", ".inc"}
DEFAULT_ROOT = pathlib.Path(__file__).resolve().parent.parent

# A comment, a string or a character literal; raw strings first, since they may hold quotes.
_TOKEN = re.compile(
    r'R"(?P<delim>[^(\s]*)\(.*?\)(?P=delim)"|//[^\n]*|/\*.*?\*/'
    r'|"(?:\\.|[^"\\\n])*"|(?<![0-9a-fA-F])\'(?:\\.|[^\'\\\n])+\'',
    re.DOTALL,
)


def parse_root(description, **extra):
    """The parsed command line; --root names the tree (default: the one this script lies in).

    `extra` maps further positional names to their help texts.
    """
    parser = argparse.ArgumentParser(description=description)
    parser.add_argument("--root", type=pathlib.Path, default=DEFAULT_ROOT)
    for name, text in extra.items():
        parser.add_argument(name, help=text)
    return parser.parse_args()


def tree_files(root, *folders):
    """Files that git tracks or would track, as paths relative to root, below any of `folders`."""
    listing = subprocess.run(
        ["git", "-C", str(root), "ls-files", "-z", "-c", "-o", "--exclude-standard", "--", *folders],
        check=True, capture_output=True, text=True).stdout
    names = sorted(set(filter(None, listing.split("\0"))))
    return [pathlib.PurePosixPath(name) for name in names if (root / name).is_file()]


def source_files(root, *folders):
    """The C and C++ files among tree_files."""
    return [path for path in tree_files(root, *folders) if path.suffix in SOURCE_SUFFIXES]


def code_lines(text):
    """The lines of `text` with comments blanked and literals emptied; line numbers stay true."""

    def blank(match):
        token = match.group(0)
        filler = "\n" * token.count("\n")
        return filler if token.startswith("/") else '""' + filler

    return _TOKEN.sub(blank, text).split("\n")


def finish(name, problems, subject):
    """Prints the problems, or one line that says how much was looked at, and exits."""
    for problem in problems:
        print(problem)
    if problems:
        sys.exit(f"{name}: {len(problems)} problem(s)")
    print(f"{name}: {subject}: clean")
