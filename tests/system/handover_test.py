#!/usr/bin/env python3
"""A queue's way from those who write it to the one who drains it; FILEINDEX_LONG gives the stress its full length."""
import os
import random
import subprocess
import time
import unittest

import private_machine as machine

QUEUE, RECORD = machine.SCRATCH + "/@fileindex/docs/queue", machine.SCRATCH + "/record"
PRODUCERS, EVENTS, KILLS = (8, 250000, 50) if os.environ.get("FILEINDEX_LONG") else (8, 25000, 10)


def start(name, *arguments):
    return subprocess.Popen([os.environ["TEST_PROGRAMS"] + "/" + name, *map(str, arguments)])


class HandoverTest(unittest.TestCase):
    def test_queues_are_listed_and_shown_as_they_would_be_drained_and_left_alone(self):
        machine.write("/etc/vexo/shares.conf", "[docs]\npath={0}/docs\n[void]\npath={0}/void\n".format(machine.SCRATCH))
        machine.write(QUEUE + ".tmp", '{"event":128,"path":"/v/a"}\n')
        machine.write(QUEUE, '{"event":64,"path":"/v/a"}\n{"event":256,"path":"/v/b","path_old":"/v/c"}\n')
        os.utime(QUEUE + ".tmp", (0, time.time() - 1000))
        files = [(file["path"], file["exists"], file["bytes"], (file["idle_seconds"] or 0) >= 1000)
                 for file in machine.ctl("queue", "list")[1]]
        self.assertEqual(files, [(QUEUE + ".tmp", True, 28, True), (QUEUE, True, 73, False),
                                 (QUEUE.replace("docs", "void"), False, 0, False)])
        operations = [(op["op"], op["path"]) for op in machine.ctl("queue", "show", "docs")[1]]
        self.assertEqual(operations, [(1, "/v/a"), (2, "/v/a"), (5, "/v/b")])
        self.assertEqual((machine.ctl("queue", "show", "void"), sorted(os.listdir(os.path.dirname(QUEUE)))),
                         ((0, []), ["queue", "queue.tmp"]))

    def test_no_event_is_lost_or_torn_however_often_the_consumer_is_killed(self):
        machine.write(QUEUE)
        print("seed 1", flush=True)
        moments, part = random.Random(1), EVENTS // PRODUCERS
        producers = [start("queue_produce", QUEUE, i * part, (i + 1) * part) for i in range(PRODUCERS)]
        for _ in range(KILLS):
            consumer = start("queue_drain", QUEUE, RECORD)
            time.sleep(moments.uniform(0, 0.1))
            consumer.kill()
            self.assertEqual(consumer.wait(), -9)
        self.assertEqual([producer.wait() for producer in producers], [0] * PRODUCERS)
        self.assertEqual(start("queue_drain", QUEUE, RECORD, "end").wait(), 0)
        with open(RECORD, encoding="ascii") as record:
            self.assertEqual(set(record) - {"/v/a\n", "/v/b\n"}, {"/v/%d/%d\n" % (i, i) for i in range(EVENTS)})


if __name__ == "__main__":
    machine.enter()
    unittest.main()
