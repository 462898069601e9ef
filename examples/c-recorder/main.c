/* Records itself for some seconds, and prints where the movie lies:
 *
 *   quorvel-example-c-recorder [SECONDS [COPY]]
 *
 * With COPY the movie is copied to that path, too. Without a display it has no window; that is for a daemon without
 * one. Everything runs in the one loop below: what the library has to tell waits in a queue until the loop asks for it.
 */
#define _POSIX_C_SOURCE 200809L

#include <errno.h>
#include <fcntl.h>
#include <quorvel/quorvel.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <time.h>
#include <unistd.h>

#include "window.h"

enum { WIDTH = 640, HEIGHT = 360, FRAME_MILLISECONDS = 16 };
/* A device takes a moment to see which application has come to the front. */
static const double time_to_come_to_front = 0.3;
static const double longest_wait_for_focus = 3;

struct application {
  quorvel_recorder* recorder;
  struct window* window; /* NULL without a display */
  double seconds;        /* how long it records */
  const char* copy;      /* where the movie goes; NULL: nowhere */
  double begins, ends;   /* when to start and to stop; 0: not yet */
  bool done;
  int exit_code;
};

static double now(void) {
  struct timespec time;
  clock_gettime(CLOCK_MONOTONIC, &time);
  return (double)time.tv_sec + (double)time.tv_nsec / 1e9;
}

static void fail(struct application* application, const char* what, const char* why) {
  fprintf(stderr, "%s: %s\n", what, why);
  application->exit_code = 1;
  application->done = true;
}

/* The movie's file belongs to the daemon; an application reads it by the descriptor that it is given. */
static bool copy_movie(int movie, const char* path) {
  const int copy = open(path, O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0600);
  if (copy < 0) return false;
  static char buffer[1 << 16];
  ssize_t count = 0;
  bool good = true;
  while (good && (count = read(movie, buffer, sizeof buffer)) > 0) {
    for (ssize_t done = 0, part = 0; good && done < count; done += part) {
      part = write(copy, buffer + done, (size_t)(count - done));
      good = part > 0;
    }
  }
  return close(copy) == 0 && good && count == 0;
}

static void movie_opened(void* context, const quorvel_error* error, int file) {
  struct application* application = context;
  if (error != NULL) {
    fail(application, "the movie cannot be opened", error->text);
    return;
  }
  if (!copy_movie(file, application->copy)) fail(application, application->copy, strerror(errno));
  close(file);
  application->done = true;
}

static void stopped(void* context, const quorvel_error* error, const char* movie_url) {
  struct application* application = context;
  char path[4096];
  if (error != NULL) {
    fail(application, "no movie", error->text);
    return;
  }
  quorvel_file_path(movie_url, path, sizeof path);
  printf("%s\n", path);
  application->done = application->copy == NULL;
  if (!application->done) quorvel_recorder_open_movie(application->recorder, movie_url, movie_opened, application);
}

static void ended_by_itself(void* context, const quorvel_error* error, const char* movie_url) {
  (void)movie_url;
  fail(context, "the recording ended", error != NULL ? error->text : "nobody knows why");
}

static void started(void* context, const quorvel_error* error, bool microphone, bool camera) {
  struct application* application = context;
  (void)microphone, (void)camera;
  if (error != NULL) {
    fail(application, "not recording", error->text);
    return;
  }
  application->ends = now() + application->seconds;
}

static void start(struct application* application) {
  /* Without a window a device's headless screen knows us by our process. */
  const uint32_t window = application->window ? window_identifier(application->window) : (uint32_t)getpid();
  quorvel_start_options options = QUORVEL_START_OPTIONS_INIT;
  options.windows = &window;
  options.window_count = 1;
  options.width = WIDTH;
  options.height = HEIGHT;
  quorvel_recorder_did_become_active(application->recorder, NULL, NULL);
  quorvel_recorder_start(application->recorder, &options, started, application);
}

/* One round of the loop: the window, then whatever is due. */
static void step(struct application* application, double began) {
  if (application->window != NULL) {
    if (!window_dispatch(application->window)) fail(application, "the display", "it has gone");
    window_draw(application->window, now() - began);
  }
  const bool is_in_front = application->window == NULL || window_is_active(application->window);
  if (application->begins == 0 && (is_in_front || now() - began > longest_wait_for_focus))
    application->begins = now() + time_to_come_to_front;
  if (application->begins > 0 && now() >= application->begins) {
    application->begins = -1; /* once */
    start(application);
  }
  if (application->ends > 0 && now() >= application->ends) {
    application->ends = 0;
    quorvel_recorder_stop(application->recorder, stopped, application);
  }
}

int main(int count, char** arguments) {
  struct application application = {0};
  application.seconds = count > 1 ? atof(arguments[1]) : 5;
  application.copy = count > 2 ? arguments[2] : NULL;
  if (application.seconds <= 0 || count > 3) {
    fprintf(stderr, "usage: %s [SECONDS [COPY]]\n", arguments[0]);
    return 2;
  }
  if (getenv("DISPLAY") != NULL && (application.window = window_open(WIDTH, HEIGHT)) == NULL) {
    fprintf(stderr, "the display %s does not answer\n", getenv("DISPLAY"));
    return 1;
  }

  quorvel_recorder_options options = QUORVEL_RECORDER_OPTIONS_INIT;
  options.queue = quorvel_queue_create();
  options.events.context = &application;
  options.events.stopped = ended_by_itself;
  application.recorder = quorvel_recorder_create(&options);

  const double began = now();
  while (!application.done) {
    step(&application, began);
    quorvel_queue_wait(options.queue, FRAME_MILLISECONDS);
  }

  quorvel_recorder_destroy(application.recorder);
  quorvel_queue_release(options.queue);
  window_close(application.window);
  return application.exit_code;
}
