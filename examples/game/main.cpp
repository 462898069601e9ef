// Comet Run: a small game that records itself. Game.cpp shows the use of the client library.

#include <cstdio>

#include "Game.h"
#include "MainLoop.h"
#include "Options.h"
#include "Sound.h"

int main(int argc, char** argv) {
  const comet::Options options = comet::parseOptions(argc, argv);
  std::setvbuf(stdout, nullptr, _IOLBF, 0);
  comet::MainLoop loop;
  std::unique_ptr<comet::Sound> sound;
  if (options.sound) {
    std::string error;
    sound = comet::Sound::create(options.title.c_str(), options.tone, error);
    if (!sound) std::printf("sound error=%s\n", error.c_str());
  }
  comet::Game game(loop, options);
  loop.run();
  return game.ok() ? 0 : 1;
}
