"""Descriptors and threads that run short while the daemon runs, and come back."""
import itertools
import os
import subprocess

from harness import SystemTest, Wire

NOBODY = 65534


class Shortages(SystemTest):
    def test_the_first_request_meets_a_shortage_that_passes(self):
        """The connection is there; the HTTP thread, its wake-up or its socket cannot be had."""
        options = {}
        if os.getuid() == 0:  # whom no limit of threads binds
            for path, _, names in os.walk(self.root.path):
                for name in ["", *names]:
                    os.chown(os.path.join(path, name), NOBODY, NOBODY)
            options = {"user": NOBODY, "group": NOBODY, "extra_groups": []}
        for limit, free in (("nproc", 0), *(("nofile", free) for free in range(4))):
            with self.subTest((limit, free)), self.serving(**options) as daemon:
                pid = daemon.popen.pid

                def limit_to(number):  # by the daemon's own user: another one may lack the right
                    subprocess.run(["prlimit", f"--pid={pid}", f"--{limit}={number}:"], check=True, **options)
                first, second = Wire(self.root), Wire(self.root)
                first.describe(6), second.describe(7)
                open_ones = {int(name) for name in os.listdir(f"/proc/{pid}/fd")}
                next_ones = itertools.islice((n for n in itertools.count() if n not in open_ones), free, None)
                limit_to(next(next_ones) if limit == "nofile" else 1)
                self.assertIsNone(first.call("startConfigWithCompletionHandler:")["results"].get("backends"))
                limit_to(1000)
                self.assertEqual(second.call("startConfigWithCompletionHandler:")["results"]["backends"], ["httppost"])
                first.close(), second.close()
