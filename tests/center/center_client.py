"""A small client of corv-center's JSON API for the tests: a cookie jar, the CSRF token,
multipart uploads, and waiting for a task's end."""
import http.cookiejar
import json
import os
import time
import urllib.error
import urllib.request

BASE = os.environ.get("CENTER_URL", "http://127.0.0.1:8490")


class Client:
    def __init__(self):
        self.jar = http.cookiejar.CookieJar()
        self.opener = urllib.request.build_opener(urllib.request.HTTPCookieProcessor(self.jar))
        self.csrf = ""
        self.last_headers = {}

    def call(self, method, path, body=None, csrf=None, content_type="application/json"):
        """(status, parsed JSON or None). `csrf` None sends the session's token."""
        data = None
        headers = {}
        if body is not None:
            data = body if isinstance(body, bytes) else json.dumps(body).encode()
            headers["Content-Type"] = content_type
        token = self.csrf if csrf is None else csrf
        if method != "GET" and token:
            headers["X-CSRF-Token"] = token
        request = urllib.request.Request(BASE + path, data=data, headers=headers, method=method)
        try:
            with self.opener.open(request, timeout=60) as response:
                status, raw, self.last_headers = response.status, response.read(), response.headers
        except urllib.error.HTTPError as error:
            status, raw, self.last_headers = error.code, error.read(), error.headers
        try:
            return status, json.loads(raw)
        except ValueError:
            return status, None

    def login(self, user, password):
        status, body = self.call("POST", "/api/login", {"user": user, "password": password})
        if status == 200:
            self.csrf = body["csrf"]
        return status, body

    def upload(self, name, content, csrf=None):
        boundary = "----corvcenter" + str(time.time_ns())
        body = (f"--{boundary}\r\nContent-Disposition: form-data; name=\"file\"; "
                f"filename=\"{name}\"\r\nContent-Type: application/octet-stream\r\n\r\n"
                ).encode() + content + f"\r\n--{boundary}--\r\n".encode()
        return self.call("POST", "/api/upload", body, csrf,
                         "multipart/form-data; boundary=" + boundary)

    def wait(self, task_id, until=("done", "failed", "cancelled"), seconds=60):
        deadline = time.time() + seconds
        while time.time() < deadline:
            status, task = self.call("GET", "/api/tasks/" + task_id)
            if status != 200 or task["state"] in until:
                return task
            time.sleep(0.2)
        raise AssertionError(f"task {task_id} did not reach {until}: {task}")
