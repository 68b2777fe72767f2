#!/usr/bin/python3
# tests/unit/platform/check_digest_apache.py: what the digest library writes, a real Apache obeys:
# check_digest_apache.py DIGEST_FILE_TOOL
#
# Apache serves one protected page on the loopback interface, from a temporary folder.
import hashlib
import http.client
import os
import random
import re
import shlex
import signal
import socket
import stat
import subprocess
import sys
import tempfile
import time
from contextlib import ExitStack
from pathlib import Path

APACHE = "/usr/sbin/apache2"
MODULES = Path("/usr/lib/apache2/modules")
REALM = "PRIVANE"
RANDOM_TEXTS = 150
START_SECONDS = 20

CONFIG = """
ServerRoot "{folder}"
ServerName localhost
Listen 127.0.0.1:{port}
PidFile "{folder}/apache.pid"
DefaultRuntimeDir "{folder}"
Mutex "file:{folder}" default
ErrorLog "{folder}/error.log"
User www-data
Group www-data
StartServers 1
{modules}
DocumentRoot "{folder}/pages"
AuthDigestShmemSize 64K
<Directory "{folder}/pages">
  AuthType Digest
  AuthName "{realm}"
  AuthDigestProvider file
  AuthUserFile "{folder}/digest"
  Require valid-user
</Directory>
"""


def md5(text):
    return hashlib.md5(text).hexdigest()


def entry(user, password):
    return f"{user}:{REALM}:{md5(f'{user}:{REALM}:{password}'.encode())}".encode()


class WebServer:
    def __init__(self, folder):
        self.folder = folder
        self.file = folder / "digest"
        (folder / "pages").mkdir()
        (folder / "pages" / "index.html").write_text("let in\n")
        os.chmod(folder, 0o755)
        with socket.socket() as probe:
            probe.bind(("127.0.0.1", 0))
            self.port = probe.getsockname()[1]
        modules = "".join(f'LoadModule {name}_module "{MODULES}/mod_{name}.so"\n' for name in (
            "mpm_event", "authn_core", "authn_file", "authz_core", "authz_user", "auth_digest"))
        config = folder / "apache.conf"
        config.write_text(CONFIG.format(folder=folder, port=self.port, modules=modules,
                                        realm=REALM))
        self.process = subprocess.Popen([APACHE, "-d", folder, "-f", config, "-DFOREGROUND"],
                                        stdin=subprocess.DEVNULL)
        self.nonce = self.first_nonce()

    def first_nonce(self):
        deadline = time.monotonic() + START_SECONDS
        while time.monotonic() < deadline and self.process.poll() is None:
            try:
                status, challenge = self.request({})
            except OSError:
                time.sleep(0.02)
                continue
            assert status == 401, f"without a password: {status}"
            return re.search(r'nonce="([^"]+)"', challenge).group(1)
        log = self.folder / "error.log"
        sys.exit("Apache does not start: " + (log.read_text() if log.exists() else "no log"))

    def request(self, headers):
        connection = http.client.HTTPConnection("127.0.0.1", self.port, timeout=20)
        connection.request("GET", "/index.html", headers=headers)
        response = connection.getresponse()
        response.read()
        connection.close()
        return response.status, response.getheader("WWW-Authenticate", "")

    def status_for(self, user, password):
        user = user.encode()
        proof = md5(f"{md5(user + f':{REALM}:{password}'.encode())}:{self.nonce}:00000001:c:auth:"
                    f"{md5(b'GET:/index.html')}".encode())
        header = (b'Digest username="' + user + f'", realm="{REALM}", nonce="{self.nonce}", '
                  f'uri="/index.html", qop=auth, nc=00000001, cnonce="c", response="{proof}"'
                  .encode())
        return self.request({"Authorization": header})[0]

    def stop(self):
        self.process.send_signal(signal.SIGTERM)
        self.process.wait(20)


class Library:
    def __init__(self, tool, file):
        # A build for another machine is run by an emulator, which Meson names.
        emulator = shlex.split(os.environ.get("MESON_EXE_WRAPPER", ""))
        self.process = subprocess.Popen([*emulator, tool, file], stdin=subprocess.PIPE,
                                        stdout=subprocess.PIPE, text=True)

    def run(self, command):
        self.process.stdin.write(command + "\n")
        self.process.stdin.flush()
        answer = self.process.stdout.readline()
        assert answer == "0\n", f"{command}: {answer!r}"

    def stop(self):
        self.process.stdin.close()
        assert self.process.wait(20) == 0


def odd_texts():
    alice = entry("alice", "old")
    bob = entry("bob", "bobs")
    hashed = alice.rsplit(b":", 1)[1]
    for form in (alice + b"\n", alice, alice + b"\r\n", b" \t\v\f\r" + alice + b" \t\n",
                 b"alice::PRIVANE:::" + hashed + b"\n", b"alice:PRIVANE\n", b"alice:PRIVANE  \n",
                 alice + b":more\n", b"al\\\nice:PRIVANE:" + hashed + b"\n",
                 b"al\\\r\nice:PRI\\\n\\\nVANE:" + hashed + b"\n", b"\\\n" + alice + b"\n",
                 alice + b"\\\n", alice + b"\\", b"# \\\n" + alice + b"\n", b"#" + alice + b"\n",
                 b"alice:PRIVANE\0 hidden\\\n", b"al\0ice:PRIVANE:" + hashed + b"\n",
                 b"# \\", b"# \\\n", b"# \\\\\\\n", b"# \\\r", b"x\\\r\n", b"", b"\n", b"\\\n"):
        yield bob + b"\n" + form
        yield form + bob
    pieces = [b"alice", b"bob", b"al", b"ice", b":", b":", b"::", b"PRIVANE", b"OTHER", b"\n",
              b"\n", b"\r\n", b"\r", b"\\\n", b"\\\n", b"\\", b"\\\r\n", b" ", b"\t", b"#", b"\xff",
              hashed, alice, alice + b"\n", bob, bob + b"\n", b"\0", b"alice:PRIVANE:x\n"]
    chance = random.Random(20200714)
    for _ in range(RANDOM_TEXTS):
        yield b"".join(chance.choice(pieces) for _ in range(chance.randrange(24)))


def check_text(server, library, text):
    """Faults of the changes of alice's entry in a file that holds the text."""
    server.file.write_bytes(text)
    bobs_before = server.status_for("bob", "bobs")
    assert bobs_before in (200, 401), bobs_before

    library.run("set alice new")
    if server.status_for("alice", "new") != 200:
        yield "the new password is refused"
    if server.status_for("alice", "old") != 401:
        yield "the old password still works"
    if server.status_for("bob", "bobs") != bobs_before:
        yield "another user is affected by the new password"

    # Alice's line is gone for good, in whatever form it stood there at first.
    for prepare in (lambda: None, lambda: server.file.write_bytes(text)):
        prepare()
        library.run("delete alice")
        for password in ("new", "old"):
            if server.status_for("alice", password) != 401:
                yield f"after the removal the {password} password works"
        if server.status_for("bob", "bobs") != bobs_before:
            yield "another user is affected by the removal"


def check_new_file(server, library):
    """Faults of a file that the library makes itself."""
    if os.geteuid() != 0:  # Only root can give it to the group of the web server.
        server.file.touch(0o640)
    library.run("set ål€ with:colon")
    mode = stat.S_IMODE(server.file.stat().st_mode)
    if mode != 0o640:
        yield f"a new file has the mode {mode:o}"
    if server.status_for("ål€", "with:colon") != 200:
        yield "a user of a new file is refused"


def main():
    # A test that takes too long is ended by this signal, and Apache must end with it.
    signal.signal(signal.SIGTERM, lambda *_: sys.exit("ended by a signal"))
    faults = []
    texts = list(odd_texts())
    with tempfile.TemporaryDirectory() as name:
        with ExitStack() as stack:
            server = WebServer(Path(name))
            stack.callback(server.stop)
            library = Library(sys.argv[1], server.file)
            stack.callback(library.stop)
            faults += check_new_file(server, library)
            server.file.chmod(0o644)
            for text in texts:
                faults += [f"{text!r}: {fault}" for fault in check_text(server, library, text)]
    for fault in faults:
        print(fault, file=sys.stderr)
    print(f"{len(texts) + 1} files, {len(faults)} faults")
    return 1 if faults else 0


if __name__ == "__main__":
    sys.exit(main())
