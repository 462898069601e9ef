#!/usr/bin/env bash
# Applications in C++ (as pkg-config and as CMake tell it) and C, built against the installed libraries, start; so does one
# in Python.
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

cat >"$image/CMakeLists.txt" <<'CMAKE'
cmake_minimum_required(VERSION 3.16)
project(user LANGUAGES CXX)
find_package(Quorvel 0.1 REQUIRED)
find_package(QuorvelExtension 0.1 REQUIRED)
add_executable(user-by-cmake user.cpp)
target_link_libraries(user-by-cmake PRIVATE Quorvel::quorvel Quorvel::quorvel-extension)
CMAKE
cmake -G Ninja -S "$image" -B "$image/build" -DCMAKE_PREFIX_PATH="$image/opt" >"$image/cmake.log"
cmake --build "$image/build" >>"$image/cmake.log"
"$image/build/user-by-cmake"
