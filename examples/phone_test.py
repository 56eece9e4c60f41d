# SPDX-License-Identifier: Apache-2.0
"""How a program tests its own reporting, with unittest: python3 phone_test.py"""
import unittest

import veltra.testing


def report_call(session, codec, seconds):
    """The code under test."""
    session.start()
    session.send(5, 1, {"codec": codec, "seconds": seconds})


class Phone(unittest.TestCase):
    def test_it_reports_a_call(self):
        with veltra.testing.Daemon() as daemon, veltra.Session(client_type=7, root=daemon.root) as session:
            report_call(session, "opus", 12.5)
            self.assertTrue(daemon.wait(1))
            message = daemon.messages[0]
            self.assertEqual((message["category"], message["type"]), (5, 1))
            self.assertEqual(message["payload"], {"codec": "opus", "seconds": 12.5})


if __name__ == "__main__":
    unittest.main()
