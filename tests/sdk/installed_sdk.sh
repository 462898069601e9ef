#!/usr/bin/env bash
# An application built against the installed client and extension libraries, as pkg-config and as CMake tell it, starts.
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

cat >"$image/CMakeLists.txt" <<'CMAKE'
cmake_minimum_required(VERSION 3.16)
project(user LANGUAGES CXX)
find_package(Quorvel 0.1 REQUIRED)
find_package(QuorvelExtension 0.1 REQUIRED)
add_executable(user-by-cmake user.cpp)
target_link_libraries(user-by-cmake PRIVATE Quorvel::quorvel Quorvel::quorvel-extension)
CMAKE
cmake -S "$image" -B "$image/build" -DCMAKE_PREFIX_PATH="$image/opt" >"$image/cmake.log"
cmake --build "$image/build" >>"$image/cmake.log"
"$image/build/user-by-cmake"
