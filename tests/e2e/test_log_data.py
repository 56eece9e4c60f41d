# SPDX-License-Identifier: Apache-2.0
"""Log data: the upload of a client's array and the message to the dashboard about it."""
import json

from harness import SystemTest, storebag, wait_until

DASHBOARD = {"dashboard": {"ip": "127.0.0.1", "port": "${dashboardPort}", "reliable": 100,
                           "post_url": "${url}/logdata"}}


class LogData(SystemTest):
    def upload(self, data, status=0):
        path = self.root.path / "logs.json"
        path.write_text(data if isinstance(data, str) else json.dumps(data))
        out, said = self.ctl("upload-log-data", "--client-type", "7", "--session-id", "9", str(path), status=status)
        return out and json.loads(out), said

    def test_upload_and_the_place_that_is_reported(self):
        self.lab.put("quindle", storebag(backends=DASHBOARD))
        data = [{"log": "x" * (3 << 20), "at": {"$date": 1700000000.5}, "raw": {"$data": "AP8="}}, -7, [True, 1.5]]
        done = {"op": "uploadLogData", "uploaded": True, "error": None}
        with self.serving("Error uploading log data array", "Log data array upload failed"):
            self.assertEqual(self.upload(data)[0], done)
            session, _ = self.open()
            self.assertEqual(session.ask("uploadLogData", data=data[1:]), done)
            self.lab.control(path="/logdata", cut=True)
            self.assertEqual(session.ask("uploadLogData", data=[]), {**done, "uploaded": False})
            self.lab.reset()
            self.assertEqual(self.upload("[" + "0," * 99_000 + "0]")[0], done)
            self.assertEqual(session.close(), 0)
            first, second, _, many = self.lab.received("logdata", 4)
        self.assertEqual((first["body"], second["body"], many["body"]), (data, data[1:], [0] * 99_001))
        self.assertEqual((first["method"], first["headers"]["Content-Type"]), ("POST", "application/octet-stream"))
        def places():
            lines = self.lab.received("dashboard")
            return [line["payload"]["LogDataUploadLocation"] for line in lines
                    if (line["method"], line["respCode"]) == (0, 2) and "LogDataUploadLocation" in line["payload"]]
        wait_until(lambda: len(places()) >= 3, "three announcements")
        self.assertEqual(sorted(places()), [line["answer"] for line in (first, second, many)])

    def test_failed_uploads_and_wrong_files(self):
        with self.serving("Log data array upload failed"):
            self.assertIn("Nobody took", self.upload([1], status=1)[1])
        for data, problem in (("[1", "logs.json: not JSON"), ("{}", "expected an array, found an object")):
            self.assertIn(problem, self.upload(data, status=2)[1])

    def test_bounds(self):
        self.lab.put("quindle", storebag(backends=DASHBOARD))
        self.lab.put("ostvane", storebag(backends={"dashboard": {**DASHBOARD["dashboard"], "post_url": 7}}))
        large = ["x" * (15 << 20)]  # three times this is charged, and two of them exceed the budget of one user
        with self.serving("Post URL for log data array is nil", "Log data array upload failed"):
            first, _ = self.open()
            other, _ = self.open(6)
            self.assertFalse(other.ask("uploadLogData", data=[1])["uploaded"])
            self.lab.control(path="/logdata", stall=True)
            first.say(op="uploadLogData", data=large)
            self.lab.received("logdata", 1)
            self.assertIn("is used up; try again later", self.upload(large, status=1)[1])
            self.assertEqual(other.send()["reply"] is None, False)
            self.lab.reset()
            self.assertTrue(first.answer()["uploaded"])
