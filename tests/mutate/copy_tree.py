"""copy_tree.py SOURCE COPY: makes COPY the tree that SOURCE is. A file that is the same already keeps its time, so that it is not built again.
"""

import os
import pathlib
import shutil
import sys

LEFT_OUT = {"build", "__pycache__"}


def files_of(tree):
    found = set()
    for directory, names, files in os.walk(tree):
        is_top = pathlib.Path(directory) == tree
        names[:] = [name for name in names if name not in LEFT_OUT and not (is_top and name.startswith("."))]
        found.update((pathlib.Path(directory) / name).relative_to(tree) for name in files)
    return found


def copy(source, target):
    wanted = files_of(source)
    for path in files_of(target) - wanted if target.exists() else ():
        (target / path).unlink()
    for path in wanted:
        content = (source / path).read_bytes()
        if not (target / path).is_file() or (target / path).read_bytes() != content:
            (target / path).parent.mkdir(parents=True, exist_ok=True)
            (target / path).write_bytes(content)
            shutil.copymode(source / path, target / path)


if __name__ == "__main__":
    copy(pathlib.Path(sys.argv[1]), pathlib.Path(sys.argv[2]))
