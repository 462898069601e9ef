"""The example upload extensions against real servers, with a played host: a live stream with a pause, read by ffmpeg as an
RTMP server; and clips, put on an HTTP server that is out of order at first.

usage: test_uploads.py PLAYED_HOST PLUGINS_DIRECTORY
"""
import http.server
import os
import re
import subprocess
import sys
import tempfile
import threading

ROOT = os.path.dirname(os.path.dirname(os.path.dirname(os.path.abspath(__file__))))
sys.path.insert(0, os.path.join(ROOT, "scripts/stage"))
from testsignal import frame_times, free_port, run, worst_distance  # noqa: E402


class Server(http.server.BaseHTTPRequestHandler):
    """Keeps what is put; the first answer is a 503."""
    protocol_version = "HTTP/1.1"
    files, answers = {}, []

    def do_PUT(self):
        content = self.rfile.read(int(self.headers["Content-Length"]))
        status = 201 if self.answers else 503
        self.answers.append(status)
        if status == 201:
            self.files[self.path] = content
        self.send_response(status)
        self.send_header("Content-Length", "0")
        self.end_headers()

    def log_message(self, *_):
        pass


def say(arguments, **options):
    text = subprocess.run(arguments, capture_output=True, timeout=60, check=True, stdin=subprocess.DEVNULL, text=True,
                          **options).stdout
    print(text)
    return text


def test_live(host, plugins, directory):
    url = f"rtmp://127.0.0.1:{free_port()}/live/test"
    received = os.path.join(directory, "live.flv")
    # It takes one stream, and ends with it. The extension tries again until it listens.
    server = subprocess.Popen(["ffmpeg", "-v", "error", "-y", "-listen", "1", "-i", url, "-c", "copy", received],
                              stdin=subprocess.DEVNULL)
    try:
        said = say([host, os.path.join(plugins, "LiveUpload.plugin/bin/live-upload"), "samples", "7", "url=" + url,
                    "playbackURL=https://watch.example/1", "keyFrameInterval=1"],
                   env={**os.environ, "PAUSE": "3.5"})
        server.wait(30)
    finally:
        server.kill()
    assert "url https://watch.example/1" in said and 'state="live"' in said and "exit 0" in said
    # The pause is in neither picture nor sound.
    seen, distance = worst_distance(received)
    print(f"flashes at {seen}; a beep is {distance:.3f} s away at the most")
    assert len(seen) >= 4 and distance < 0.06
    assert frame_times(received)[-1] < 7.6, "the pause is in the stream"


def test_clips(host, plugins, directory):
    clips = []
    for index in (1, 2, 3):
        clip = os.path.join(directory, f"QVMovie_com.example_0.5_{index}.mp4")
        run(["ffmpeg", "-v", "error", "-f", "lavfi", "-i", "testsrc=s=320x180:r=30:d=2", "-f", "lavfi", "-i",
             "sine=1000:d=2:r=44100", "-c:v", "libx264", "-preset", "ultrafast", "-pix_fmt", "yuv420p",
             "-bf", "0", "-c:a", "aac", clip])
        clips.append(clip)
    server = http.server.ThreadingHTTPServer(("127.0.0.1", 0), Server)
    threading.Thread(target=server.serve_forever, daemon=True).start()
    said = say([host, os.path.join(plugins, "ClipUpload.plugin/bin/clip-upload"), "clips", ",".join(clips),
                f"url=http://127.0.0.1:{server.server_port}/show", "name=game", "clipDuration=2"])
    server.shutdown()
    assert Server.answers[0] == 503, "the first was refused, and tried again"
    assert "clipDuration=2.0" in said and 'state="finished"' in said and "exit 0" in said
    for path, content in Server.files.items():
        with open(os.path.join(directory, os.path.basename(path)), "wb") as file:
            file.write(content)
    playlist = os.path.join(directory, "game.m3u8")
    text = open(playlist).read()
    print(text)
    assert text.endswith("#EXT-X-ENDLIST\n") and "DISCONTINUITY" not in text
    assert re.findall(r"game-\d+\.ts", text) == [f"game-0000{index}.ts" for index in (1, 2, 3)]
    # One stream: all pictures are there, and no step between two is longer than a frame.
    times = frame_times(playlist)
    assert len(times) == 180, len(times)
    assert all(0.030 < b - a < 0.037 for a, b in zip(times, times[1:])), "a gap"


def main():
    host, plugins = sys.argv[1:]
    with tempfile.TemporaryDirectory(prefix="quorvel-uploads-") as directory:
        test_clips(host, plugins, directory)
        test_live(host, plugins, directory)


main()
