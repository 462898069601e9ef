"""The demo of a recording (recording.py), whose sound server is PipeWire, with WirePlumber and its server for PulseAudio clients:
a private one, also where there is a sound server.

usage: pipewire.py BUILD_DIRECTORY OUTPUT_DIRECTORY
"""
# build: quorveld quorveld-movies quorvel-example-game
import recording
from stage.device import Stage


class Demo(recording.Demo):
    def __init__(self, build):
        super().__init__(build, sound="PipeWire")

    def start_sound(self):
        Stage.start_sound(self)
        print(f"sound: {self.sound} with a null output")


recording.main(Demo)
