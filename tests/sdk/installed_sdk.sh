#!/usr/bin/env bash
# Applications in C++ and C, built against the installed libraries as pkg-config tells it, start; so does one in Python.
#   installed_sdk.sh BUILD_DIRECTORY
set -euo pipefail
image=$(mktemp -d)
trap 'rm -rf "$image"' EXIT
DESTDIR=$image cmake --install "$1" --prefix /opt >"$image/install.log"
cat >"$image/user.cpp" <<'CPP'
#include <quorvel/BroadcastExtension.h>
#include <quorvel/Recorder.h>

int main() { return quorvel::Recorder::create() ? 0 : 1; }
CPP
libraries=$image/opt/lib
export PKG_CONFIG_PATH=$libraries/pkgconfig
# shellcheck disable=SC2046
c++ "$image/user.cpp" -o "$image/user" $(pkg-config --cflags --libs quorvel quorvel-extension)
LD_LIBRARY_PATH=$libraries "$image/user"

cat >"$image/user.c" <<'C'
#include <quorvel/quorvel.h>

int main(void) {
  quorvel_recorder_options options = QUORVEL_RECORDER_OPTIONS_INIT;
  quorvel_recorder* recorder = quorvel_recorder_create(&options);
  quorvel_recorder_destroy(recorder);
  return recorder != NULL ? 0 : 1;
}
C
# shellcheck disable=SC2046
cc -std=c11 -Wall -Wextra -pedantic -Werror "$image/user.c" -o "$image/user-c" $(pkg-config --cflags --libs quorvel)
LD_LIBRARY_PATH=$libraries "$image/user-c"
PYTHONPATH=$libraries/python3/dist-packages PYTHONDONTWRITEBYTECODE=1 /usr/bin/python3 -c "import quorvel; quorvel.Recorder()"
