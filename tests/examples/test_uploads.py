"""The example upload extensions against real servers, with a played host: a live stream with a pause, read by ffmpeg as an
RTMP server; one over SRT whose receiver goes away; streams that no server takes; and clips, put on an HTTP server that
is out of order at first.

usage: test_uploads.py PLAYED_HOST PLUGINS_DIRECTORY
"""
import http.server
import os
import re
import socket
import ssl
import subprocess
import sys
import tempfile
import threading

sys.path.insert(0, os.path.join(os.path.dirname(os.path.abspath(__file__)), "../../scripts"))
from stage.processes import Child  # noqa: E402
from stage.movie import frame_times, free_port, run, run_silently, worst_distance  # noqa: E402


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


def start_live(host, plugins, *info, **environment):
    """A stream that goes on until it is told to end."""
    program = os.path.join(plugins, "LiveUpload.plugin/bin/live-upload")
    return Child([host, program, "samples", "100", *info], {**os.environ, **environment})


def start_receiver(port, file):
    """Keeps what comes, byte by byte."""
    return Child(["ffmpeg", "-nostdin", "-v", "error", "-y", "-f", "data", "-i", f"srt://127.0.0.1:{port}?mode=listener",
                  "-map", "0", "-c", "copy", "-f", "data", file], os.environ, "stderr")


def await_frames(child, connection, count):
    """Until `count` frames more than at first have gone over that connection."""
    since, first = 0, None
    while True:
        line = child.expect(f'connections="{connection}"', since)
        since = child.lines.index(line) + 1
        sent = int(re.search(r'sentFrames="(\d+)"', line[1])[1])
        first = sent if first is None else first
        if sent >= first + count:
            return


def test_srt(host, plugins, directory):
    """The receiver goes away and comes back. The pictures lie on their side."""
    port = free_port()
    before, after = (os.path.join(directory, name) for name in ("before.ts", "after.ts"))
    receivers = [start_receiver(port, before)]
    live = start_live(host, plugins, f"url=srt://127.0.0.1:{port}", "keyFrameInterval=1", ORIENTATION="6")
    try:
        await_frames(live, 1, 60)
        receivers[0].stop()
        live.expect('state="reconnecting"')
        receivers.append(start_receiver(port, after))
        await_frames(live, 2, 60)
        live.process.terminate()
        live.process.wait(30)
        receivers[1].process.wait(30)
    finally:
        for child in (live, *receivers):
            child.stop()
    print(live.output())
    first, second = frame_times(before), frame_times(after)
    seen, distance = worst_distance(after, 0.3)
    print(f"{len(first)} frames, a gap of {second[0] - first[-1]:.2f} s, {len(second)} frames; flashes at {seen}, a beep is "
          f"{distance:.3f} s away at the most")
    assert live.process.returncode == 0
    assert first[-1] < second[0] and all(a < b for a, b in zip(second, second[1:])), "times go back"
    assert seen and distance < 0.06
    run_silently(["ffmpeg", "-v", "error", "-i", after, "-f", "null", "-"])  # it needs nothing of the former connection
    size = run(["ffprobe", "-v", "error", "-select_streams", "v", "-show_entries", "stream=width,height", "-of", "default=nk=1:nw=1",
                after]).split()
    assert size[:2] == [b"360", b"640"], size


def serve_untrusted(directory):
    """A TLS server whose certificate nobody signed; its port."""
    key, certificate = (os.path.join(directory, name) for name in ("key.pem", "certificate.pem"))
    run(["openssl", "req", "-x509", "-newkey", "ec", "-pkeyopt", "ec_paramgen_curve:prime256v1", "-nodes", "-subj",
         "/CN=localhost", "-keyout", key, "-out", certificate])
    context = ssl.SSLContext(ssl.PROTOCOL_TLS_SERVER)
    context.load_cert_chain(certificate, key)
    server = socket.create_server(("127.0.0.1", 0))

    def answer():
        try:
            context.wrap_socket(server.accept()[0], server_side=True)
        except OSError:
            pass  # it hangs up
    threading.Thread(target=answer, daemon=True).start()
    return server.getsockname()[1]


def test_refusals(host, plugins, directory):
    """Streams that no server takes end with a reason, some at once."""
    for url, reason, is_tried_again in ((f"rtmp://127.0.0.1:{free_port()}/live/x", "Connection refused", True),
                                        ("rtmp://127.0.0.1:99999/live/x", "uri", False),
                                        (f"rtmps://localhost:{serve_untrusted(directory)}/live/x", "certificate", False)):
        live = start_live(host, plugins, "url=" + url, "reconnectTimeout=1")
        try:
            said = live.expect("error code=")[1]
            live.process.terminate()
            live.process.wait(30)
        finally:
            live.stop()
        print(said)
        tries = sum('state="connecting"' in line for _, line in live.lines)
        assert 'code="-5808"' in said and reason in said and (tries > 1) == is_tried_again, live.lines
        assert live.process.returncode == 0


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
        test_srt(host, plugins, directory)
        test_refusals(host, plugins, directory)


main()
