// A switch over the events of a window, for a listing that has cases of it.
#include <quorvel/Recorder.h>
#include <xcb/xcb.h>

void guide(quorvel::Recorder* recorder, int event) {
  switch (event) {
    // LISTING
  }
}
