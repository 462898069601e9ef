"""Three applications share the one recorder: each starts a recording in turn, and each earlier one is told that
it was interrupted. The last one stops by itself and gets its movie. The metrics file holds a line for each.

usage: many.py BUILD_DIRECTORY OUTPUT_DIRECTORY
"""
# build: quorveld quorveld-movies quorvel-example-game
import json
import os
import sys
import time

sys.path.insert(0, os.path.join(os.path.dirname(os.path.abspath(__file__)), ".."))
from stage.applications import Application  # noqa: E402
from stage.device import Stage  # noqa: E402
from stage.movie import keep, path_in, report  # noqa: E402

INTERRUPTED = -5806
SECONDS = 2  # each recording's length
METRICS = "private/var/mobile/Library/Logs/Quorvel/metrics.jsonl"


class Device(Stage):
    def prepare(self):
        self.allow_recordings()  # consent is what scripts/demo shows


def record_in_turn(stage, cast):
    """Whether each earlier application was told; and what the last one's stop gave."""
    good = True
    former = None
    for application in cast:
        application.bring_to_front()
        time.sleep(0.5)  # the device takes a moment to see it
        asked = application.child.mark()
        stage.press("r")
        print(f"{application.name}: {application.child.expect('started microphone', asked)[1]}")
        if former:
            told = former.child.expect("stopped")[1]
            was_interrupted = f"error={INTERRUPTED}" in told
            good = good and was_interrupted
            print(f"{former.name} is told: {told} ({'interrupted' if was_interrupted else 'NOT interrupted'})")
        time.sleep(SECONDS)
        former = application
    stage.press("s")
    stopped = former.child.expect("stopped")[1]
    print(f"{former.name}: {stopped}")
    return good, stopped


def check_metrics(stage, count):
    """One line a recording. A recording that is finished, also because another start asks for it, has reason 0."""
    with open(os.path.join(stage.root, METRICS)) as file:
        events = [json.loads(line)["payload"] for line in file]
    for event in events:
        print(f"metrics: EndReason {event['EndReason']}, "
              + ", ".join(f"{key} {event[key]}" for key in sorted(event) if "Count" in key or "Duration" in key))
    good = len(events) == count and all(event["EndReason"] == 0 for event in events)
    print(f"metrics: {len(events)} lines, {'as' if good else 'NOT as'} expected: {count}, each with reason 0")
    return good


def main():
    build, output = sys.argv[1:]
    with Device(build, screen=(1280, 720)) as stage:
        cast = [Application(stage, name) for name in ("First", "Second", "Third")]
        good, stopped = record_in_turn(stage, cast)
        for earlier in cast[:-1]:
            ends = sum("stopped" in line for _, line in earlier.child.lines)
            good = good and ends == 1
            print(f"{earlier.name} was told {ends} time{'s' if ends != 1 else ''}")
        good = check_metrics(stage, len(cast)) and good
        movie = keep(path_in(stopped), output)
    report(movie, good)


main()
