"""The security rules of corv-center's API, asked over HTTP: no session, a wrong CSRF
token, a wrong password, a user who is no administrator, uploads over the cap or that are
no package, names that are no package names; and an upload installed end to end."""
import json
import os
import sys
import time
import unittest
import urllib.parse

from center_client import Client


class NoSession(unittest.TestCase):
    def test_every_api_path_wants_a_session(self):
        client = Client()
        cases = [("GET", "/api/packages"), ("GET", "/api/packages/hello"),
                 ("GET", "/api/store"), ("GET", "/api/updates"), ("GET", "/api/tasks"),
                 ("GET", "/api/session"), ("POST", "/api/packages/hello/stop"),
                 ("POST", "/api/store/install"), ("POST", "/api/upload"),
                 ("POST", "/api/tasks/0123abcd/install"), ("POST", "/api/logout")]
        for method, path in cases:
            with self.subTest(method=method, path=path):
                status, body = client.call(method, path, {} if method == "POST" else None)
                self.assertEqual(status, 401)
                self.assertEqual(body["error"], "login")

    def test_the_page_itself_needs_none(self):
        status, _ = Client().call("GET", "/")
        self.assertEqual(status, 200)


class Login(unittest.TestCase):
    def test_refusals(self):
        cases = [("alice", "wrong", 401, "credentials"), ("nobody-here", "x", 401, "credentials"),
                 ("alice", "", 401, "credentials"), ("bob", "bob-secret", 403, "not_admin")]
        for user, password, want_status, want_error in cases:
            with self.subTest(user=user, password=password):
                client = Client()
                status, body = client.login(user, password)
                self.assertEqual((status, body["error"]), (want_status, want_error))
                self.assertNotIn("Set-Cookie", client.last_headers)
                self.assertEqual(client.call("GET", "/api/packages")[0], 401)

    def test_administrator_gets_a_strict_http_only_cookie_until_logout(self):
        client = Client()
        status, body = client.login("alice", "alice-secret")
        self.assertEqual(status, 200)
        cookie = client.last_headers["Set-Cookie"]
        self.assertIn("HttpOnly", cookie)
        self.assertIn("SameSite=Strict", cookie)
        self.assertEqual(len(body["csrf"]), 64)
        self.assertEqual(client.call("GET", "/api/session")[1]["user"], "alice")
        self.assertEqual(client.call("POST", "/api/logout")[0], 200)
        self.assertEqual(client.call("GET", "/api/packages")[0], 401)


class Csrf(unittest.TestCase):
    def test_state_changes_want_the_session_token(self):
        client = Client()
        client.login("alice", "alice-secret")
        other = Client()
        other.login("alice", "alice-secret")
        before = len(client.call("GET", "/api/tasks")[1])
        tokens = [("missing", ""), ("wrong", "0" * 64), ("another session's", other.csrf),
                  ("shortened", client.csrf[:-1])]
        for label, token in tokens:
            with self.subTest(token=label):
                status, body = client.call("POST", "/api/store/install",
                                           {"packages": ["hello"]}, csrf=token or "-")
                self.assertEqual((status, body["error"]), (403, "csrf"))
                status, body = client.upload("x.cpk", b"x", csrf=token or "-")
                self.assertEqual((status, body["error"]), (403, "csrf"))
        self.assertEqual(len(client.call("GET", "/api/tasks")[1]), before)


class Uploads(unittest.TestCase):
    def setUp(self):
        self.client = Client()
        self.client.login("alice", "alice-secret")

    def test_refused_files(self):
        cases = [("not a package", b"just text", 400), ("empty", b"", 400),
                 ("over the cap", b"\0" * (1024 * 1024 + 1), 413)]
        for label, content, want in cases:
            with self.subTest(upload=label):
                status, _ = self.client.upload("../../etc/evil.cpk", content)
                self.assertEqual(status, want)
        self.assertFalse(os.path.exists("/etc/evil.cpk"))

    def test_names_that_are_no_package_names_reach_nothing(self):
        for name in ["hello;touch /tmp/pwned", "../../etc", "$(touch /tmp/pwned)"]:
            with self.subTest(name=name):
                status, _ = self.client.call(
                    "POST", "/api/packages/" + urllib.parse.quote(name, safe="") + "/start", {})
                self.assertEqual(status, 404)
        status, body = self.client.call("POST", "/api/store/install",
                                        {"packages": ["hello; touch /tmp/pwned"]})
        self.assertEqual((status, body["error"]), (400, "not_in_store"))
        self.assertFalse(os.path.exists("/tmp/pwned"))

    def test_an_uploaded_package_installs_and_runs(self):
        with open(os.environ["CENTER_HELLO"], "rb") as file:
            status, task = self.client.upload("hello.cpk", file.read())
        self.assertEqual(status, 201, task)
        self.assertEqual(task["state"], "ready")
        self.assertEqual(task["questions"][0]["package"], "hello")
        status, _ = self.client.call("POST", "/api/tasks/" + task["id"] + "/install",
                                     {"answers": {}, "accept_unsigned": True})
        self.assertEqual(status, 202)
        done = self.client.wait(task["id"])
        self.assertEqual(done["state"], "done", done)
        status, rows = self.client.call("GET", "/api/packages")
        self.assertEqual([(r["package"], r["status_word"]) for r in rows], [("hello", "running")])
        # A second install of the same task is refused: its file is gone.
        status, _ = self.client.call("POST", "/api/tasks/" + task["id"] + "/install", {})
        self.assertEqual(status, 409)
        # A logged-out session no longer sees the task.
        self.client.call("POST", "/api/logout")
        self.assertEqual(self.client.call("GET", "/api/tasks/" + task["id"])[0], 401)


class StoreTasks(unittest.TestCase):
    def test_a_download_waiting_for_answers_cancels_and_stays_private(self):
        client = Client()
        client.login("alice", "alice-secret")
        status, task = client.call("POST", "/api/store/install", {"packages": ["greeter"]})
        self.assertEqual(status, 202, task)
        ready = client.wait(task["id"], until=("ready", "failed"))
        self.assertEqual(ready["state"], "ready", ready)
        # hello, which greeter needs and which is not installed, comes first.
        self.assertEqual([step["package"] for step in ready["plan"]], ["hello", "greeter"])
        self.assertEqual([q["package"] for q in ready["questions"]], ["hello", "greeter"])
        keys = [item["key"] for step in ready["questions"][1]["wizard"] for item in step["items"]]
        self.assertEqual(keys, ["GREETER_GREETING", "GREETER_PORT"])

        carol = Client()
        carol.login("carol", "carol-secret")
        for method, path in [("GET", ""), ("POST", "/cancel"), ("POST", "/install")]:
            with self.subTest(other_user=method + path):
                status, _ = carol.call(method, "/api/tasks/" + task["id"] + path,
                                       {} if method == "POST" else None)
                self.assertEqual(status, 404)

        status, cancelled = client.call("POST", "/api/tasks/" + task["id"] + "/cancel")
        self.assertEqual((status, cancelled["state"]), (200, "cancelled"))
        self.assertEqual(sorted(os.listdir("/tmp/center-state/" + task["id"])),
                         ["owner.json", "request.json", "state.json"])
        status, _ = client.call("POST", "/api/tasks/" + task["id"] + "/install", {})
        self.assertEqual(status, 409)
        self.assertEqual(client.call("GET", "/api/packages")[1], [])


class CancelDownload(unittest.TestCase):
    def test_a_stalled_download_cancels_and_leaves_nothing(self):
        faults = os.path.join(os.environ["CENTER_FEED_DIR"], "faults.json")
        with open(faults, "w") as file:
            json.dump([{"path": "/hello-*", "stall_after": 1000, "stall_seconds": 30}], file)
        try:
            client = Client()
            client.login("alice", "alice-secret")
            status, task = client.call("POST", "/api/store/install", {"packages": ["hello"]})
            self.assertEqual(status, 202, task)
            client.wait(task["id"], until=("downloading",))
            status, cancelled = client.call("POST", "/api/tasks/" + task["id"] + "/cancel")
            self.assertEqual((status, cancelled["state"]), (200, "cancelled"))
            # The worker goes, and with it the engine's own download record: a new
            # download of hello is not refused as one under way.
            deadline = time.time() + 20
            while time.time() < deadline:
                status, again = client.call("POST", "/api/store/install", {"packages": ["hello"]})
                if status == 202:
                    break
                time.sleep(0.2)
            self.assertEqual(status, 202, again)
            client.call("POST", "/api/tasks/" + again["id"] + "/cancel")
            self.assertEqual(client.call("GET", "/api/tasks/" + task["id"])[1]["state"],
                             "cancelled")
        finally:
            os.unlink(faults)


if __name__ == "__main__":
    result = unittest.main(argv=[sys.argv[0], "-v"], exit=False).result
    sys.exit(0 if result.wasSuccessful() else 1)
