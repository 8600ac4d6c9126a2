#!/usr/bin/env python3
"""The installed library as its users meet it: found by pkg-config and by CMake, exporting its interface and no more."""
import glob
import os
import re
import subprocess
import tempfile
import unittest

BUILD = os.environ["FILEINDEX_BUILD_DIR"]
CMAKE = os.environ.get("FILEINDEX_CMAKE", "cmake")
CXX = os.environ.get("FILEINDEX_CXX", "c++")

CONSUMER = r"""
#include "common/error.h"
#include "fileindex/optree.h"

int main() {
  try {
    quarrox::fileindex::Event("{");
  } catch (const quarrox::Error& error) {
    return error.code == 906 ? 0 : 1;
  }
}
"""

CMAKE_LISTS = """
cmake_minimum_required(VERSION 3.25)
project(consumer LANGUAGES CXX)
set(CMAKE_CXX_STANDARD 20)
find_package(fileindex 0.1 REQUIRED)
add_executable(consumer consumer.cpp)
target_link_libraries(consumer PRIVATE fileindex::fileindex)
"""


def run(*command, **options):
    done = subprocess.run(command, stdout=subprocess.PIPE, stderr=subprocess.STDOUT, text=True, **options)
    if done.returncode != 0:
        raise AssertionError("%s failed:\n%s" % (" ".join(command), done.stdout))
    return done.stdout


class InstallTest(unittest.TestCase):
    @classmethod
    def setUpClass(cls):
        place = tempfile.TemporaryDirectory()
        cls.addClassCleanup(place.cleanup)
        cls.prefix, cls.work = place.name + "/prefix", place.name
        run(CMAKE, "--install", BUILD, "--prefix", cls.prefix)
        cls.library = glob.glob(cls.prefix + "/lib*/**/libfileindex.so", recursive=True)[0]
        with open(cls.work + "/consumer.cpp", "w") as source:
            source.write(CONSUMER)

    def test_a_consumer_builds_and_runs_through_pkg_config(self):
        directory = os.path.dirname(self.library)
        env = dict(os.environ, PKG_CONFIG_PATH=directory + "/pkgconfig", LD_LIBRARY_PATH=directory)
        flags = run("pkg-config", "--cflags", "--libs", "fileindex", env=env).split()
        run(CXX, "-std=c++20", "-Wall", "-Wextra", "-Wpedantic", "-Werror", "consumer.cpp", "-o", "consumer", *flags,
            cwd=self.work)
        run(self.work + "/consumer", env=env)

    def test_a_consumer_builds_and_runs_through_cmake(self):
        with open(self.work + "/CMakeLists.txt", "w") as lists:
            lists.write(CMAKE_LISTS)
        run(CMAKE, "-S", self.work, "-B", self.work + "/build", "-DCMAKE_PREFIX_PATH=" + self.prefix,
            "-DCMAKE_CXX_COMPILER=" + CXX)
        run(CMAKE, "--build", self.work + "/build")
        run(self.work + "/build/consumer")

    def test_only_the_interface_is_exported_under_a_major_version(self):
        names = run("nm", "-DC", "--defined-only", "--format=posix", self.library).splitlines()
        self.assertTrue(any(re.match(r"quarrox::fileindex::Event::Event\(", name) for name in names), names)
        foreign = [name for name in names if not re.match(r"((vtable|typeinfo|typeinfo name) for )?quarrox::", name)]
        self.assertEqual(foreign, [])
        self.assertEqual([name for name in names if "(anonymous" in name or "quarrox::log::" in name], [])
        self.assertRegex(run("readelf", "-d", self.library), r"SONAME.*\[libfileindex\.so\.\d+\]")

    def test_what_reads_files_lies_where_the_library_looks_for_it(self):
        self.assertTrue(os.access(os.path.dirname(self.library) + "/fileindex/vexocontentextract", os.X_OK))


if __name__ == "__main__":
    unittest.main()
