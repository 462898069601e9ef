"""Broadcasts reach a real streaming server: nginx, on loopback, with its RTMP and WebDAV modules.

Four runs of the example application: its live stream, which a viewer reads back; one in whose middle the server goes away
for a while; its clips, put there as an HLS stream; and one whose extension is killed in the middle, after which the next
broadcast must work.

usage: broadcast.py BUILD_DIRECTORY OUTPUT_DIRECTORY
"""
# build: quorveld quorveld-movies quorvel-example-game quorvel-extension-launcher live-upload clip-upload
import os
import re
import shutil
import signal
import sys
import time

sys.path.insert(0, os.path.join(os.path.dirname(os.path.abspath(__file__)), ".."))
from stage.device import Stage  # noqa: E402
from stage.movie import frame_times, free_port, worst_distance  # noqa: E402
from stage.processes import children, extension_processes, wait_until  # noqa: E402

LIVE, CLIPS = "com.example.quorvel.game.live.upload", "com.example.quorvel.game.clips.upload"
INVALID_BROADCAST = -5808
FRAME = 1 / 30
WORST_SYNC = 0.06   # seconds
CUT_MARGIN = 0.3    # a flash at the stream's ends may have lost its beep
SECONDS = 8
ABSENCE = 3         # seconds for which the server is away
CLIP_SECONDS = 2

NGINX = """
daemon off;
{user}
worker_processes 1;
pid nginx.pid;
load_module /usr/lib/nginx/modules/ngx_rtmp_module.so;
events {{ worker_connections 64; }}
rtmp {{
  access_log off;
  server {{ listen 127.0.0.1:{rtmp}; application live {{ live on; wait_key on; idle_streams off; }} }}
}}
http {{
  access_log off;
  client_body_temp_path body; proxy_temp_path proxy; fastcgi_temp_path fastcgi; uwsgi_temp_path uwsgi;
  scgi_temp_path scgi;
  server {{
    listen 127.0.0.1:{http};
    root www;
    client_max_body_size 256m;
    location / {{ dav_methods PUT; create_full_put_path on; }}
  }}
}}
"""


class Server:
    """nginx with everything of its in a directory of the stage's."""

    def __init__(self, stage):
        self.directory = os.path.join(stage.directory, "nginx")
        self.files = os.path.join(self.directory, "www")
        os.makedirs(self.files)
        self.rtmp, self.http = free_port(), free_port()
        configuration = os.path.join(self.directory, "nginx.conf")
        with open(configuration, "w") as file:
            file.write(NGINX.format(user="user root;" if os.geteuid() == 0 else "", rtmp=self.rtmp, http=self.http))
        program = shutil.which("nginx", path=os.environ["PATH"] + ":/usr/sbin") or sys.exit("demo: nginx is missing")
        self.stage = stage
        self.command = [program, "-p", self.directory + "/", "-c", configuration, "-e", "error.log"]
        self.start()

    def start(self):
        # It writes that file once it listens.
        started = os.path.join(self.directory, "nginx.pid")
        if os.path.exists(started):
            os.remove(started)
        self.master = self.stage.start(self.command)
        wait_until("nginx", lambda: os.path.exists(started))

    def crash(self):
        """Its connections end with its processes, without a word."""
        victims = [*children(self.master.pid), self.master.pid]
        for victim in victims:
            os.kill(victim, signal.SIGKILL)
        self.stage.end(self.master)
        return victims


class Device(Stage):
    def prepare(self):
        self.allow_recordings()  # consent is what scripts/demo shows


def play(stage, extension, info, script, *options):
    """The application, which broadcasts at once."""
    for key, value in info.items():
        options += "--broadcast-info", f"{key}={value}"
    return stage.start_game("--broadcast", extension, *options, size="1280x720", script=script)


def service(child):
    """What the extension said last: {key: text}."""
    lines = [line for _, line in child.lines if line.startswith("service")]
    return dict(re.findall(r'(\w+)="([^"]*)"', lines[-1])) if lines else {}


def live_info(server, name):
    url = f"rtmp://127.0.0.1:{server.rtmp}/live/{name}"
    return {"url": url, "playbackURL": url, "keyFrameInterval": 1}


def start_viewer(stage, url, file):
    """Its stream ends when the broadcast does. `-copyts`: with the stream's own times."""
    return stage.start(["ffmpeg", "-nostdin", "-v", "error", "-y", "-i", url, "-copyts", "-c", "copy", file], "stderr")


def is_in_order(times):
    return all(a < b for a, b in zip(times, times[1:]))


def run_live(stage, server, output):
    info = live_info(server, "game")
    seen = os.path.join(output, "live.flv")
    game = play(stage, LIVE, info, f"record {SECONDS}; stop; quit")
    print("application: " + game.expect("started")[1])
    line = game.expect("broadcast url=")[1]
    print("application: " + line)
    viewer = start_viewer(stage, line.split("url=")[1], seen)
    print("application: " + game.expect("stopped", seconds=SECONDS + 20)[1])
    told = service(game)
    stage.end(game)
    viewer.process.wait(20)
    times = frame_times(seen)
    flashes, distance = worst_distance(seen, CUT_MARGIN)
    in_order = is_in_order(times)
    print(f"live: {len(times)} frames over {times[-1] - times[0]:.2f} s seen by the viewer, "
          f"{'in order' if in_order else 'NOT in order'}; lost {told['droppedFrames']} of {told['receivedFrames']}")
    print(f"live: latency {float(told['deliveryMilliseconds']):.1f} ms to the extension, "
          f"{float(told['latencyMilliseconds']):.1f} ms through it to the socket (means)")
    print(f"live: {len(flashes)} flashes, each with its beep within {distance * 1000:.0f} ms")
    return in_order and len(flashes) >= SECONDS // 2 - 1 and distance < WORST_SYNC


def run_reconnect(stage, server, output):
    """The server crashes and comes back while the broadcast runs; a viewer before and a viewer after."""
    url = live_info(server, "again")["url"]
    files = [os.path.join(output, name) for name in ("before.flv", "after.flv")]
    game = play(stage, LIVE, live_info(server, "again"), f"record {2 * SECONDS + ABSENCE}; stop; quit")
    game.expect("broadcast url=")
    viewer = start_viewer(stage, url, files[0])
    time.sleep(SECONDS)
    print(f"the server is killed: {server.crash()}")
    viewer.process.wait(20)
    print("application: " + game.expect('state="reconnecting"')[1])
    time.sleep(ABSENCE)
    server.start()
    mark = game.mark()
    print("application: " + game.expect('connections="2"', mark)[1])
    viewer = start_viewer(stage, url, files[1])
    stopped = game.expect("stopped", seconds=2 * SECONDS + 20)[1]
    print("application: " + stopped)
    told = service(game)
    stage.end(game)
    viewer.process.wait(20)
    before, after = map(frame_times, files)
    flashes, distance = worst_distance(files[1], CUT_MARGIN)
    in_order = is_in_order(before + after)
    print(f"reconnect: {len(before)} frames, a gap of {after[0] - before[-1]:.2f} s, {len(after)} frames, "
          f"{'in order' if in_order else 'NOT in order'}; {told['connections']} connections, "
          f"dropped {told['droppedFrames']} of {told['receivedFrames']}")
    print(f"reconnect: {len(flashes)} flashes after it, each with its beep within {distance * 1000:.0f} ms")
    return "error=0" in stopped and in_order and len(flashes) >= 1 and distance < WORST_SYNC


def run_clips(stage, server, output):
    info = {"url": f"http://127.0.0.1:{server.http}/clips/", "name": "game", "clipDuration": CLIP_SECONDS}
    game = play(stage, CLIPS, info, f"record {SECONDS}; stop; wait 3; quit", "--clip-duration", str(CLIP_SECONDS))
    print("application: " + game.expect("started")[1])
    print("application: " + game.expect("stopped", seconds=SECONDS + 20)[1])
    put = os.path.join(server.files, "clips")
    playlist = os.path.join(put, "game.m3u8")
    wait_until("the end of the playlist", lambda: os.path.exists(playlist) and "ENDLIST" in open(playlist).read())
    print("application: " + str(service(game)))
    stage.end(game)
    shutil.copytree(put, os.path.join(output, "clips"), dirs_exist_ok=True)
    text = open(playlist).read()
    lengths = [float(length) for length in re.findall(r"#EXTINF:([\d.]+)", text)]
    times = frame_times(playlist)
    gap = max((b - a for a, b in zip(times, times[1:])), default=0)
    flashes, distance = worst_distance(playlist, CUT_MARGIN)
    print(f"clips: {len(lengths)} of {', '.join(f'{length:.2f}' for length in lengths)} s; playlist of {sum(lengths):.2f} s")
    print(f"clips: {len(times)} frames, the longest step between two {gap * 1000:.0f} ms; "
          f"{len(flashes)} flashes, each with its beep within {distance * 1000:.0f} ms")
    left = os.listdir(stage.movies)
    print(f"clips: {len(left)} files left in the temporary store")
    return len(lengths) >= 3 and abs(sum(lengths) - SECONDS) < 1 and distance < WORST_SYNC and not left


def run_crash(stage, server):
    game = play(stage, LIVE, live_info(server, "crash"), "record 600")
    game.expect('state="live"')
    victims = extension_processes(stage)
    print(f"the extension is killed: {victims}")
    for victim in victims:
        os.kill(victim, signal.SIGKILL)
    line = game.expect("stopped")[1]
    print("application: " + line)
    stage.end(game)
    again = play(stage, LIVE, live_info(server, "again"), "record 3; stop; quit")
    again.expect('state="live"')
    after = again.expect("stopped")[1]
    print("the next broadcast: " + after)
    stage.end(again)
    return f"error={INVALID_BROADCAST}" in line and "error=0" in after


def main():
    build, output = map(os.path.abspath, sys.argv[1:])
    output = os.path.join(output, "broadcast")
    shutil.rmtree(output, ignore_errors=True)
    os.makedirs(output)
    with Device(build) as stage:
        server = Server(stage)
        results = {"live": run_live(stage, server, output), "reconnect": run_reconnect(stage, server, output),
                   "clips": run_clips(stage, server, output), "crash": run_crash(stage, server)}
    for name, good in results.items():
        print(f"{name}: {'good' if good else 'NOT good'}")
    print("movie: " + os.path.join(output, "clips/game.m3u8"))
    sys.exit(0 if all(results.values()) else 1)


main()
