"""A machine of a test's own: what is mounted and written in it is gone with the test.

    import private_machine as machine
    machine.enter()                                   # before any test runs; the program starts anew in the namespace
    machine.write("/etc/vexo/shares.conf", "[docs]\npath = %s/docs\n" % machine.SCRATCH)
    status, lines = machine.ctl("share", "list")      # fileindexctl with --json

/etc is a copy of the machine's own, in which /etc/vexo and /etc/samba are empty. SCRATCH, /var, /run and /tmp are empty,
but for the directories that every machine has in /var. Everything else is the real machine: it is not to be written to.
"""
import json
import os
import shutil
import subprocess
import sys

SCRATCH = "/dev/shm"  # there on every machine, and nobody's files are hidden by what is mounted over it


def enter():
    """Goes on in a mount namespace of its own, as root or as an ordinary user in a user namespace."""
    if "PRIVATE_MACHINE" not in os.environ:
        os.environ["PRIVATE_MACHINE"] = "entered"
        options = "-m" if os.geteuid() == 0 else "-Urm"
        os.execvp("unshare", ["unshare", options, sys.executable, *sys.orig_argv[1:]])
    run = lambda *command: subprocess.run(command, check=True)
    run("mount", "-t", "tmpfs", "-o", "mode=0755", "scratch", SCRATCH)
    # Not an overlay: an ordinary user could not write what the real root owns.
    subprocess.run(["cp", "-RP", "--preserve=mode", "/etc", SCRATCH + "/.etc"], stderr=subprocess.DEVNULL)
    run("mount", "--bind", SCRATCH + "/.etc", "/etc")
    build = os.environ["FILEINDEX_BUILD_DIR"]
    kept = os.open(build, os.O_PATH)
    for place in ("/var", "/run", "/tmp"):
        run("mount", "-t", "tmpfs", "-o", "mode=1777", "scratch", place)
    if not os.path.exists(build):  # a tree that somebody has there stays in sight
        os.makedirs(build)
        run("mount", "-c", "--bind", "/proc/%d/fd/%d" % (os.getpid(), kept), build)
    os.symlink("/run", "/var/run")
    for directory in ("/var/lib", "/var/tmp", "/var/log"):
        os.makedirs(directory, exist_ok=True)
    for directory in ("/etc/vexo", "/etc/samba"):
        shutil.rmtree(directory, ignore_errors=True)
        os.makedirs(directory, exist_ok=True)


def write(path, content=""):
    """Writes a file in its place, with the directories above it."""
    os.makedirs(os.path.dirname(path), exist_ok=True)
    with open(path, "w", encoding="utf-8", errors="surrogateescape") as file:
        file.write(content)


def ctl(*arguments):
    """The exit status of fileindexctl and its answer: an object for each line."""
    result = subprocess.run([os.environ["FILEINDEXCTL"], *arguments, "--json"], stdout=subprocess.PIPE)
    lines = result.stdout.decode("utf-8", "surrogateescape").splitlines()
    return result.returncode, [json.loads(line) for line in lines]
