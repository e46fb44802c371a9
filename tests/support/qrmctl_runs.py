"""What tests of qrmctl share: a development server, runs as a person and a program make them, checks."""
import contextlib
import json
import pathlib
import subprocess
import sys
import time
import urllib.request

QRMCTL, DEVSERVER = sys.argv[1:3]
API = "ZELO.QRM.RPC"
FILE_API = "ZELO.QRM.RPC.File"
TOKEN = "s3cret-0123456789"
CA_FILE = pathlib.Path("/usr/zelo/etc/ssl/ca.d/server.pem")
STORE = pathlib.Path("/usr/zelo/etc/credentials/credentials.db")
failures = []


def check(fact, is_so, detail=""):
    if not is_so:
        failures.append(f"not so: {fact}: {detail}")


def check_same(fact, actual, expected):
    check(fact, actual == expected, f"{actual!r}, not {expected!r}")


def wait_until(fact, is_so):
    """Waits until it is so, for at most a minute."""
    end = time.monotonic() + 60
    while not is_so() and time.monotonic() < end:
        time.sleep(0.01)
    check(fact, is_so())


class Server:
    """A development server that runs, and that the box trusts."""

    def __init__(self, process, ports):
        self.process = process
        self.http, self.https = str(ports["http_port"]), str(ports["https_port"])

    def end(self):
        self.process.terminate()
        self.process.wait(60)

    def ask(self, method, path, body=None):
        request = urllib.request.Request(f"http://127.0.0.1:{self.http}/dev/{path}", method=method,
                                         headers={"Content-Type": "application/json"},
                                         data=None if body is None else
                                         json.dumps(body, ensure_ascii=False).encode(errors="surrogateescape"))
        with urllib.request.urlopen(request, timeout=60) as reply:
            return json.load(reply)

    def answer_next(self, api, method, **answer):
        self.ask("POST", "next", {"api": api, "method": method, **answer})

    def requests(self):
        """Such as ["https:discover", "https:join"]. The connection is tested once for the user and
        once by the library's join; that counts as one."""
        return list(dict.fromkeys(f"{request['scheme']}:{request['api_method']}"
                                  for request in self.ask("GET", "requests")))

    def forget(self):
        self.ask("DELETE", "requests")
        self.ask("DELETE", "next")

    def join(self, *options, http="0", https=None, token_file="/tmp/token"):
        """The arguments of a join."""
        return ["join", "--server", "localhost", "--http-port", http, "--https-port",
                https or self.https, "--token-file", token_file, *options]


@contextlib.contextmanager
def serving():
    """A server as long as it is needed. Nothing stays joined, so that no daemon stays."""
    pathlib.Path("/tmp/token").write_text(TOKEN + "\n")
    ports = pathlib.Path("/tmp/ports.json")
    CA_FILE.parent.mkdir(parents=True, exist_ok=True)
    with subprocess.Popen([DEVSERVER, "--token-file", "/tmp/token", "--ports-file", str(ports),
                           "--ca-file", str(CA_FILE)]) as server:
        try:
            wait_until("the server says its ports", ports.exists)
            yield Server(server, json.loads(ports.read_text()))
        finally:
            subprocess.run([QRMCTL, "leave"], capture_output=True)
            server.kill()


def run(*arguments, status=0, stdin=""):
    """Runs qrmctl. Whatever it says, the token is not in it."""
    done = subprocess.run([QRMCTL, *arguments], input=stdin, capture_output=True, text=True, timeout=60)
    told = f"{[argument[:60] for argument in arguments]}: {done.stdout}{done.stderr}"
    check("the token is not told", TOKEN not in done.stdout + done.stderr, told)
    check(f"the exit code is {status}", done.returncode == status, f"{done.returncode}: {told}")
    return done


def run_json(*arguments, status=0, stdin=""):
    """Runs qrmctl for a program: standard output is one line with one JSON object."""
    done = run(*arguments, "--json", status=status, stdin=stdin)
    check("one line is printed", done.stdout.find("\n") == len(done.stdout) - 1, done.stdout)
    result = json.loads(done.stdout)
    check_same(f"the success of {arguments[:2]}", result["success"], status not in (1, 2))
    return result


def finish(said):
    print("\n".join(failures) or said)
    sys.exit(1 if failures else 0)
