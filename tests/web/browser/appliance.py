"""The appliance that the page is about: the real services on volumes with generated photos.

Runs in a private root, whose /shares, /tmp and /run are its own.
"""

import json
import os
import shutil
import signal
import subprocess
import time
import urllib.parse
import urllib.request

ADDRESS = "127.0.0.1:8480"
BASE = f"http://{ADDRESS}"
DEADLINE = 60  # seconds
HERE = os.path.dirname(os.path.realpath(__file__))


def wait_for(condition, what, deadline=DEADLINE):
    """Returns the first result of `condition` that is true."""
    end = time.monotonic() + deadline
    while True:
        result = condition()
        if result:
            return result
        if time.monotonic() > end:
            raise AssertionError(f"not within {deadline} s: {what}")
        time.sleep(0.05)


def get(path):
    with urllib.request.urlopen(BASE + path, timeout=DEADLINE) as response:
        return json.load(response)


def draw_pictures(directory, count, width):
    subprocess.run(
        [os.path.join(HERE, "make-pictures"), directory, str(count), "--width", str(width)], check=True
    )


class Appliance:
    def __init__(self, programs):
        self.programs = programs
        self.services = {}
        self.mounted = []
        for directory in ("/run/orva", "/run/orva-indexer", "/run/orva-transcoder", "/tmp/state"):
            os.makedirs(directory, exist_ok=True)

    def start(self, name, *arguments, **environment):
        with open(f"/tmp/{name}.log", "ab") as log:
            self.services[name] = subprocess.Popen(
                [os.path.join(self.programs, name), *arguments],
                stdin=subprocess.DEVNULL,
                stdout=log,
                stderr=log,
                env={**os.environ, **environment},
            )

    def service(self, name):
        return self.services[name]

    def start_page(self):
        self.start("zophotos-web", "--listen", ADDRESS, "--cache", "/tmp/cache")

        def answers():
            try:
                return get("/api/status")
            except OSError:
                return None

        wait_for(answers, "the page is served")

    def start_services(self):
        os.makedirs("/shares/Photos", exist_ok=True)
        self.start("orva-notify", "serve", "--watch", "--volume", "/shares/Photos")
        wait_for(lambda: os.path.exists("/run/orva/notification.sock"), "the notification socket")
        self.start("zophotodbmerger")
        self.start("orva-indexer", STATE_DIRECTORY="/tmp/state", RUNTIME_DIRECTORY="/run/orva-indexer")
        self.start("orva-transcoder", RUNTIME_DIRECTORY="/run/orva-transcoder")

    def plug(self, name):
        """Mounts an empty volume."""
        path = f"/shares/{name}"
        os.makedirs(path, exist_ok=True)
        subprocess.run(["mount", "-t", "tmpfs", "-o", "size=64m", name, path], check=True)
        self.mounted.append(path)
        return path

    def unplug(self, path):
        wait_for(
            lambda: subprocess.run(["umount", path], stderr=subprocess.DEVNULL).returncode == 0,
            f"{path} is unmounted",
        )
        self.mounted.remove(path)
        os.rmdir(path)

    def add(self, picture, path, modified):
        """Copies a picture as a file manager does: under another name first."""
        os.makedirs(os.path.dirname(path), exist_ok=True)
        hidden = os.path.join(os.path.dirname(path), b".new" if isinstance(path, bytes) else ".new")
        shutil.copyfile(picture, hidden)
        os.utime(hidden, (modified, modified))
        os.rename(hidden, path)

    def wait_for_photos(self, count, **selection):
        """Waits until the page's list has that many photos; returns them."""

        def whole():
            photos = photos_of(**selection)
            return photos if len(photos) == count else None

        return wait_for(whole, f"{count} photos of {selection}")

    def stop(self):
        for service in reversed(self.services.values()):
            service.terminate()
            service.send_signal(signal.SIGCONT)
        for service in self.services.values():
            service.wait(timeout=DEADLINE)
        for path in self.mounted:
            subprocess.run(["umount", "--lazy", path])

    def logs(self):
        text = ""
        for name in self.services:
            with open(f"/tmp/{name}.log", errors="replace") as log:
                text += f"== {name}\n{log.read()[-3000:]}\n"
        return text


def photos_of(**selection):
    photos, before = [], {}
    while True:
        query = urllib.parse.urlencode({**selection, **before})
        answer = get(f"/api/photos?{query}")
        photos += answer["photos"]
        if not answer["more"]:
            return photos
        before = {"before": photos[-1]["id"]}
