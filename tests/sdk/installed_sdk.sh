#!/usr/bin/env bash
# An application built against the installed client and extension libraries, as pkg-config tells it, starts.
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
