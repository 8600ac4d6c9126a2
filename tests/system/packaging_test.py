#!/usr/bin/env python3
"""What is installed around the programs: manual page, completion, systemd's files, the program that shows notices."""
import glob
import json
import os
import re
import shutil
import socket
import subprocess
import unittest

import private_machine as machine

BUILD, CTL = os.environ["FILEINDEX_BUILD_DIR"], os.environ["FILEINDEXCTL"]
ROOT = BUILD + "/packaging_test"  # stays in sight
COMPLETE = """. "$0"; COMP_WORDS=("$@"); COMP_CWORD=$(($# - 1)); _fileindexctl "$1"
((!${#COMPREPLY[@]})) || printf "%s\\n" "${COMPREPLY[@]}" """


def run(*command):
    """What a command prints, wherever to."""
    return subprocess.run(command, stdout=subprocess.PIPE, stderr=subprocess.STDOUT, text=True).stdout


def installed(name):
    return glob.glob(ROOT + "/**/" + name, recursive=True)[0]


def complete(*words):
    return run("bash", "-c", COMPLETE, installed("bash-completion/completions/fileindexctl"), CTL, *words).splitlines()


def write_script(path, text):
    machine.write(path, "#!/bin/sh\n" + text)
    os.chmod(path, 0o755)


class PackagingTest(unittest.TestCase):
    def test_the_manual_page_and_completion_know_every_command_and_each_option_is_explained(self):
        names = []
        for noun in complete("")[2:]:  # --help and --version first
            one_word = run(CTL, "help", noun).startswith("usage: ")
            names += [noun] if one_word else [noun + " " + verb for verb in complete(noun, "")[1:]]
        with open(installed("fileindexctl.1"), encoding="utf-8") as page:
            in_manual = re.findall(r"^\.TP\n\\fB(\w.*?)\\fR", page.read(), re.MULTILINE)
        self.assertEqual(names, [name.replace("\\", "") for name in in_manual])
        for name in names:
            self.assertIn("\n  %s " % name, run(CTL, "--help"))
            self.assertEqual(re.findall(r"^  --\S+(?: [A-Z]\S*)? *$", run(CTL, *name.split(), "-h"), re.MULTILINE), [])
        os.environ["MANROFFOPT"] = "-z"  # nothing but warnings
        for page in ("fileindexctl.1", "fileindex.5", "fileindex-query.7", "fileindexd.8", "vexoelasticd.8", "vexonotifyd.8"):
            self.assertEqual(run("man", "--warnings", "-E", "UTF-8", "-l", "-Tutf8", installed(page)), "")
        self.assertIn("did you mean 'folder list'?", run(CTL, "foldr", "lst"))

    def test_the_page_of_the_query_language_has_each_element_that_the_help_has(self):
        told = re.findall(r"^  (\S+(?: \S+)*)  +(.*\S)", run(CTL, "search", "-h").split("QUERY may hold:")[1], re.MULTILINE)
        page = run("env", "MANROFFOPT=-rHY=0", "man", "-E", "ascii", "-l", "-Tascii", installed("fileindex-query.7"))
        page = " ".join(re.sub(r"\x1b\[[0-9;]*m|.\x08", "", page).split()).split("It may hold: ")[1].split(" The options of ")[0]
        self.assertGreater(len(told), 10)
        self.assertEqual(page, " ".join(" ".join(row) for row in told))

    def test_bash_completes_options_shares_and_folders(self):
        machine.write("/etc/vexo/shares.conf", "[docs]\npath = /srv/docs\n[two words]\npath = /srv/two words\n")
        self.assertIn("--types", complete("folder", "add", "--"))
        self.assertEqual(complete("share", "show", "t"), ["two\\ words"])
        self.assertEqual(complete("share", "show", '"two w'), ["two words"])
        self.assertEqual(complete("search", "--limit", "=", "3", "--share", "=", "d"), ["docs"])
        self.assertEqual(complete("folder", "add", "/"), ["/docs", "/two\\ words"])

    def test_systemd_takes_the_units_the_user_and_the_files(self):
        prefix = os.path.dirname(os.path.dirname(installed("bin/fileindexctl")))
        os.makedirs(ROOT + "/etc")
        subprocess.run(["mount", "--bind", prefix, prefix[len(ROOT):]], check=True)
        self.assertEqual(run("systemd-analyze", "verify", *glob.glob(prefix + "/lib/systemd/system/*")), "")
        for unit in glob.glob(prefix + "/lib/systemd/system/*.service"):  # the limit is 4.0 of 10
            subprocess.check_output(["systemd-analyze", "security", "--offline=yes", "--threshold=40", unit])
        for tool, options in [("sysusers", []), ("tmpfiles", ["--create"])]:
            conf = "%s/lib/%s.d/fileindex.conf" % (prefix, tool)
            self.assertRegex(run("systemd-" + tool, "--root=" + ROOT, *options, conf), "^(Creating .*\n)*$")

    def test_samba_is_told_of_the_search_switch_only_where_it_is_managed(self):
        folder = {"path": "/docs", "name": "docs", "document": True, "audio": True, "video": True, "photo": True}
        machine.write("/var/packages/Quarrox/etc/fileindex.folders", json.dumps([folder]))
        machine.write("/etc/samba/smb.conf", "[global]\ninclude = /var/lib/vexo/smb_search.conf\n[docs]\npath = /\n")
        for managed, expected in [("no", "No"), ("yes", "Yes")]:
            machine.write("/etc/vexo/platform.conf", "manage samba = %s\n" % managed)
            self.assertEqual(machine.ctl("call", "PrepareServices")[0], 0)
            told = run("testparm", "-s", "--section-name=docs", "--parameter-name=spotlight")
            self.assertRegex(told, expected + "\n$")

    def test_a_notice_is_logged_mailed_and_given_to_a_command_which_is_killed_when_it_hangs(self):
        received, lock, hang = ROOT + "/received", ROOT + "/lock", ROOT + "/hang"
        write_script("/usr/sbin/sendmail", '{ echo "$@"; cat; } >%s\n' % received)
        write_script(hang, "env >>%s.env; flock %s sleep 1000\n" % (received, lock))
        machine.write("/etc/vexo/platform.conf", "notice mail=a@b\nnotice time limit=1\nnotice command=%s" % hang)
        with socket.socket(socket.AF_UNIX, socket.SOCK_DGRAM) as log:
            log.bind("/dev/log")
            status = subprocess.call([installed("vexokosnotify"), "-c", "App", "-b", "true", "@administrators",
                                      "app:displayname", "error:index_no_space", "<a>", "</a>"])
            self.assertRegex(log.recv(9999).decode() + log.recv(9999).decode(),
                             "Full-text index, to @administrators: Indexing stopped.*hang did not end in time")
        with open(received, encoding="utf-8") as mail, open(received + ".env", encoding="utf-8") as environment:
            self.assertRegex(mail.read(), r"(?s)-i -- a@b\nTo: a@b\nSubject: Full-text index on .*\n\nIndexing stopped")
            self.assertIn("NOTICE_KEY=error:index_no_space\n", environment.readlines())
        self.assertEqual((status, subprocess.call(["flock", "-w", "10", lock, "true"])), (1, 0))


def replace_places():
    """A /dev without the machine's log, and a /usr/sbin without its programs."""
    devices = "/proc/%d/fd/%d" % (os.getpid(), os.open("/dev", os.O_PATH))
    script = """for place in /dev /usr/sbin; do mount -t tmpfs scratch $place; done
                mkdir /dev/shm; >/dev/null; ln -s /proc/self/fd /dev/fd
                for name in shm null; do mount --rbind "$0/$name" /dev/$name; done"""
    subprocess.run(["sh", "-ec", script, devices], check=True)


if __name__ == "__main__":
    if "PRIVATE_MACHINE" not in os.environ:  # the sources may be out of sight there
        shutil.rmtree(ROOT, ignore_errors=True)
        subprocess.run([os.environ["FILEINDEX_CMAKE"], "--install", BUILD], check=True, stdout=subprocess.DEVNULL,
                       env={**os.environ, "DESTDIR": ROOT})
    machine.enter()
    replace_places()
    unittest.main()
