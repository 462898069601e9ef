"""Prints the figures of one run."""

import statistics


def median(rounds, value):
    return statistics.median(value(r) for r in rounds)


def row(what, figure, note=""):
    print(f"  {what:<52}{figure:>18}  {note}".rstrip())


def print_costs(mode, rounds):
    print(f"\n{mode.name}, {mode.bit_rate} kbit/s, application sound and microphone; medians of {len(rounds)} rounds")
    row("processor: daemon / x11grab", f"{median(rounds, lambda r: r.daemon / r.x11grab):.2f}",
        f"{median(rounds, lambda r: r.daemon):.3f} s/s against {median(rounds, lambda r: r.x11grab):.3f}")
    row("processor: daemon / bare encoder", f"{median(rounds, lambda r: r.daemon / r.bare):.2f}",
        f"{median(rounds, lambda r: r.bare):.3f} s/s")
    row("X server's processor: daemon / x11grab",
        f"{median(rounds, lambda r: r.server / max(r.server_x11grab, 0.001)):.2f}",
        f"{median(rounds, lambda r: r.server):.3f} s/s against {median(rounds, lambda r: r.server_x11grab):.3f}; "
        "with the game's own drawing")
    row("pictures dropped by the daemon", " ".join(str(r.dropped) for r in rounds), "of each round, as it logs them")
    row("pictures in the movie / pictures due", f"{median(rounds, lambda r: r.frames):.3f}",
        f"x11grab {median(rounds, lambda r: r.x11grab_frames):.3f}")
    names = sorted({name for r in rounds for name in r.threads})
    costs = sorted(((median(rounds, lambda r: r.threads.get(name, 0.0)), name) for name in names), reverse=True)
    print("  the daemon's threads, s/s: " + ", ".join(f"{name} {cost:.3f}" for cost, name in costs if cost >= 0.001))


def print_times(first, first_stop, starts, stops):
    print("\nTimes")
    row("first start: answer of the alert to reply", f"{first[1] * 1e3:.0f} ms",
        f"{first[0] * 1e3:.0f} ms from the key")
    row("later starts: request to reply, median and worst",
        f"{statistics.median(starts) * 1e3:.0f}, {max(starts) * 1e3:.0f} ms",
        f"{len(starts)} starts, consent remembered")
    row("stop to playable movie: first, of 10 s", f"{first_stop * 1e3:.0f} ms")
    row("stop to playable movie: all others, median and worst",
        f"{statistics.median(stops) * 1e3:.0f}, {max(stops) * 1e3:.0f} ms",
        f"{len(stops)} recordings of the rounds above")


def print_capture(results):
    print("\nCapture (samples to the application)")
    for mode, (latency, cost, line, frames, rights, drawing) in results:
        row(f"{mode.name}: capture to the client's handler, median", f"{latency:.1f} ms",
            f"the handler runs in the game's main loop, which draws for about {drawing * 1e3:.1f} ms of each picture")
        row(f"{mode.name}: what the client got", line.split("video=")[1].split()[0], line)
        row(f"{mode.name}: daemon's processor", f"{cost:.3f} s/s")
        row(f"{mode.name}: frames that server, daemon and game share", str(frames),
            f"the same inodes in /proc/PID/maps of all three, game's rights {rights}: nothing is copied between them"
            if frames else "none was met; the game has each for a moment only, so this tells nothing")


def print_idle(before, after, beside_game, seconds):
    print("\nIdle daemon")
    figures = (("before the first recording", before), ("after the last recording", after))
    for when, (resident, anonymous, woken) in figures:
        row(f"resident, {when}", f"{resident / 1024:.1f} MB", f"of it anonymous {anonymous / 1024:.1f} MB")
        row(f"wake-ups in {seconds:g} s, {when}", str(woken))
    row("wake-ups in one x11grab round", str(beside_game), "a client is connected and draws, nothing is recorded")
