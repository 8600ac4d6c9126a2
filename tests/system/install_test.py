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
#include <iostream>

#include "common/error.h"
#include "fileindex/optree.h"

int main() {
  const quarrox::fileindex::Event event(R"({"event":64,"path":"/volume1/a"})");
  std::cout << event.event << " " << event.path << "\n";
  try {
    quarrox::fileindex::Event("{");
  } catch (const quarrox::Error& error) {
    std::cout << error.code << " " << error.what() << "\n";
  }
}
"""
OUTPUT = "64 /volume1/a\n906 Malformed event_raw: {\n"

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
        cls.prefix = os.path.join(place.name, "prefix")
        cls.work = os.path.join(place.name, "work")
        os.mkdir(cls.work)
        run(CMAKE, "--install", BUILD, "--prefix", cls.prefix)
        cls.library = glob.glob(cls.prefix + "/lib*/**/libfileindex.so", recursive=True)[0]
        with open(cls.work + "/consumer.cpp", "w") as source:
            source.write(CONSUMER)

    def test_a_consumer_builds_and_runs_through_pkg_config(self):
        directory = os.path.dirname(self.library)
        env = dict(os.environ, PKG_CONFIG_PATH=directory + "/pkgconfig")
        flags = run("pkg-config", "--cflags", "--libs", "fileindex", env=env).split()
        run(CXX, "-std=c++20", "-Wall", "-Wextra", "-Wpedantic", "-Werror", "consumer.cpp", "-o", "consumer", *flags,
            cwd=self.work)
        env["LD_LIBRARY_PATH"] = directory
        self.assertEqual(run(self.work + "/consumer", env=env), OUTPUT)

    def test_a_consumer_builds_and_runs_through_cmake(self):
        with open(self.work + "/CMakeLists.txt", "w") as lists:
            lists.write(CMAKE_LISTS)
        run(CMAKE, "-S", self.work, "-B", self.work + "/build", "-DCMAKE_PREFIX_PATH=" + self.prefix,
            "-DCMAKE_CXX_COMPILER=" + CXX)
        run(CMAKE, "--build", self.work + "/build")
        self.assertEqual(run(self.work + "/build/consumer"), OUTPUT)

    def test_the_soname_carries_the_major_version(self):
        self.assertRegex(run("readelf", "-d", self.library), r"SONAME.*\[libfileindex\.so\.\d+\]")

    def test_only_the_interface_is_exported(self):
        names = run("nm", "-DC", "--defined-only", "--format=posix", self.library).splitlines()
        self.assertTrue(any(re.match(r"quarrox::fileindex::Event::Event\(", name) for name in names), names)
        foreign = [name for name in names if not re.match(r"((vtable|typeinfo|typeinfo name) for )?quarrox::", name)]
        self.assertEqual(foreign, [])
        self.assertEqual([name for name in names if "(anonymous" in name or "quarrox::log::" in name], [])

    def test_no_header_of_the_platform_is_installed_or_needed(self):
        headers = glob.glob(self.prefix + "/include/**/*.h", recursive=True)
        self.assertIn(self.prefix + "/include/quarrox/common/error.h", headers)
        for header in headers:
            with open(header) as text:
                self.assertNotRegex(text.read(), r'#\s*include\s*[<"]vexo/', header)


if __name__ == "__main__":
    unittest.main()
