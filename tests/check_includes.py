#!/usr/bin/env python3
"""Checks which of our files include which: the direction between parts of the tree, and that there are no cycles.

    check_includes.py ROOT          checks a tree; prints every bad edge; exit 1 when there is one
    check_includes.py --self-test   shows that bad edges are found

Only includes of our own files are looked at; libraries from outside are chosen where they are used.
"""
import os
import re
import sys
import tempfile
import unittest

# The parts of the tree by the place of their files; the longest prefix that fits decides.
PARTS = {
    "platform/include": "seam",
    "platform/linux": "linux",
    "platform/elasticd": "elasticd",
    "platform/notifyd": "notifyd",
    "src/include/common": "common",
    "src/include/common/sdk": "sdk",
    "src/fileindex": "fileindex",
    "src/fileindexd": "fileindexd",
    "src/fileindexctl": "fileindexctl",
    "tests": "tests",
    "bench": "bench",
}

# Whom each part may include, besides itself.
ALLOWED = {
    "seam": set(),
    "linux": {"seam", "common"},
    "elasticd": {"seam", "common"},
    "notifyd": {"seam", "common"},
    "common": set(),
    "sdk": {"common", "seam"},
    "fileindex": {"common", "sdk", "seam"},
    "fileindexd": {"fileindex", "common", "sdk"},
    "fileindexctl": {"fileindex", "common", "sdk"},
    "tests": set(PARTS.values()) - {"bench"},
    "bench": set(PARTS.values()),
}

# The units of common that stand on the seam: they alone include it, and the platform does not include them.
SEAM_UNITS = {"file", "comm"}

# The order of the library's units: none includes one that stands after it.
ORDER = ["optree", "util", "folder", "folder_mgr", "queue_mgr", "communication", "status_mgr", "folder_status",
         "notices", "elastic_control", "custom_events", "index_mgr"]

INCLUDE_ROOTS = ["src/include", "src", "platform/include", "platform/elasticd", "platform/notifyd", "tests"]
INCLUDE = re.compile(r'^[ \t]*#[ \t]*include[ \t]*(["<])([^">]+)[">]', re.MULTILINE)


def part_of(path):
    fitting = [place for place in PARTS if path.startswith(place + "/")]
    return PARTS[max(fitting, key=len)] if fitting else None


def stem(path):
    return os.path.basename(path).split(".")[0]


def sources(root):
    for top in ("src", "platform", "tests", "bench"):
        for directory, _, names in os.walk(os.path.join(root, top)):
            for name in sorted(names):
                if name.endswith((".h", ".cpp")):
                    yield os.path.relpath(os.path.join(directory, name), root)


def resolve(name, includer, files):
    """Our file that an include names, as the compiler finds it: beside the includer, then along the roots."""
    for place in [os.path.dirname(includer)] + INCLUDE_ROOTS:
        candidate = os.path.normpath(os.path.join(place, name))
        if candidate in files:
            return candidate
    return None


def unit_rank(path):
    """The place in ORDER of the unit that a source of the library belongs to; the longest name that fits decides."""
    name = stem(path)
    fitting = [unit for unit in ORDER if name == unit or name.startswith(unit + "_")]
    return ORDER.index(max(fitting, key=len)) if fitting else None


def fault(includer, included):
    """Why this edge is bad, or None."""
    source, target = part_of(includer), part_of(included)
    if source is None:
        return "stands in no known part of the tree"
    if source == "common" and target == "seam":
        return None if stem(includer) in SEAM_UNITS else "only %s of common may" % " and ".join(sorted(SEAM_UNITS))
    if source in ("linux", "elasticd", "notifyd") and target == "common" and stem(included) in SEAM_UNITS:
        return "it stands on the seam, which the platform is"
    if target != source and target not in ALLOWED[source]:
        return "%s may not include %s" % (source, target)
    if source == target == "fileindex":
        mine, other = unit_rank(includer), unit_rank(included)
        if mine is not None and other is not None and other > mine:
            return "%s comes before %s" % (ORDER[mine], ORDER[other])
    return None


def find_cycle(edges):
    """A cycle of includes as a list of files, or None. Depth-first, without recursion."""
    done = set()
    for start in edges:
        todo = [(start, iter(edges[start]))] if start not in done else []
        path = [start]
        while todo:
            node, rest = todo[-1]
            following = next(rest, None)
            if following is None:
                done.add(node)
                path.pop()
                todo.pop()
            elif following in path:
                return path[path.index(following):] + [following]
            elif following not in done:
                path.append(following)
                todo.append((following, iter(edges.get(following, ()))))
    return None


def check(root):
    """All faults of a tree, as lines of text."""
    files = set(sources(root))
    faults, edges = [], {}
    for includer in sorted(files):
        with open(os.path.join(root, includer), encoding="utf-8", errors="replace") as text:
            for quote, name in INCLUDE.findall(text.read()):
                included = resolve(name, includer, files)
                if included is None:
                    if quote == '"':
                        faults.append("%s: \"%s\" is no file of ours" % (includer, name))
                    continue
                edges.setdefault(includer, []).append(included)
                why = fault(includer, included)
                if why:
                    faults.append("%s: includes %s: %s" % (includer, included, why))
    cycle = find_cycle(edges)
    if cycle:
        faults.append("cycle: " + " -> ".join(cycle))
    return faults, len(files)


class SelfTest(unittest.TestCase):
    def faults(self, tree):
        with tempfile.TemporaryDirectory() as root:
            for path, text in tree.items():
                os.makedirs(os.path.dirname(os.path.join(root, path)), exist_ok=True)
                with open(os.path.join(root, path), "w", encoding="utf-8") as out:
                    out.write(text)
            return check(root)[0]

    def test_allowed_edges_pass(self):
        self.assertEqual(self.faults({
            "src/include/common/error.h": "#include <string>\n",
            "src/include/common/file.cpp": '#include "vexo/acl.h"\n#include "common/error.h"\n',
            "src/include/common/sdk/share.h": '#include "common/error.h"\n#include "vexo/acl.h"\n',
            "src/fileindex/index_mgr.cpp": '#include "fileindex/optree_event.h"\n#include "common/sdk/share.h"\n',
            "src/fileindex/optree_event.h": '#include "common/error.h"\n',
            "src/fileindexctl/main.cpp": '#include "fileindex/optree_event.h"\n',
            "platform/include/vexo/acl.h": "#include <cstdint>\n",
            "platform/notifyd/watcher.h": '#include "common/error.h"\n',
            "platform/notifyd/main.cpp": '#include "watcher.h"\n#include <vexo/acl.h>\n',
            "tests/unit/watcher_test.cpp": '#include "watcher.h"\n',
        }), [])

    def test_each_bad_direction_is_named(self):
        targets = {
            "src/include/common/error.h": "", "src/include/common/file.h": "", "src/include/common/sdk/share.h": "",
            "src/fileindex/optree.h": "", "src/fileindexctl/table.h": "", "platform/include/vexo/acl.h": "",
            "platform/linux/shares.h": "", "platform/notifyd/watcher.h": "", "tests/support/fake.h": "", "bench/clock.h": "",
        }
        for includer, included in [
                ("src/include/common/json.cpp", "vexo/acl.h"),
                ("src/include/common/json.cpp", "common/sdk/share.h"),
                ("src/include/common/error.cpp", "fileindex/optree.h"),
                ("src/include/common/sdk/share.cpp", "fileindex/optree.h"),
                ("src/fileindex/optree.cpp", "fileindexctl/table.h"),
                ("src/fileindex/optree.cpp", "../../platform/linux/shares.h"),
                ("src/fileindexctl/main.cpp", "vexo/acl.h"),
                ("src/fileindexctl/main.cpp", "support/fake.h"),
                ("platform/include/vexo/user.h", "common/error.h"),
                ("platform/linux/acl.cpp", "common/file.h"),
                ("platform/linux/acl.cpp", "common/sdk/share.h"),
                ("platform/notifyd/main.cpp", "fileindex/optree.h"),
                ("platform/elasticd/main.cpp", "watcher.h"),
                ("tests/unit/a_test.cpp", "../../bench/clock.h")]:
            with self.subTest(includer=includer, included=included):
                found = self.faults({**targets, includer: '  # include "%s"\n' % included})
                self.assertEqual(len(found), 1, found)
                self.assertTrue(found[0].startswith(includer + ": includes "), found)

    def test_order_cycles_and_strangers_are_named(self):
        self.assertIn("optree comes before index_mgr", "".join(self.faults({
            "src/fileindex/optree.cpp": '#include "fileindex/index_mgr.h"\n', "src/fileindex/index_mgr.h": ""})))
        self.assertIn("cycle: src/fileindex/a.h -> src/fileindex/b.h -> src/fileindex/a.h", self.faults({
            "src/fileindex/a.h": '#include "fileindex/b.h"\n', "src/fileindex/b.h": '#include "a.h"\n'}))
        self.assertIn('"gone.h" is no file of ours', "".join(self.faults({"src/fileindex/a.h": '#include "gone.h"\n'})))


def main():
    if sys.argv[1:] == ["--self-test"]:
        unittest.main(argv=sys.argv[:1])
    if len(sys.argv) != 2:
        print(__doc__, file=sys.stderr)
        return 2
    faults, count = check(sys.argv[1])
    for line in faults:
        print(line)
    print("%d files, %d faults" % (count, len(faults)))
    return 1 if faults or count == 0 else 0


if __name__ == "__main__":
    sys.exit(main())
