#pragma once

/* The quorvel client library for C: record this application's own screen and sound.
 *
 *   quorvel_recorder* recorder = quorvel_recorder_create(NULL);
 *   quorvel_start_options options = QUORVEL_START_OPTIONS_INIT;
 *   options.windows = &window, options.window_count = 1;
 *   options.width = 1280, options.height = 720;
 *   quorvel_recorder_start(recorder, &options, started, context);
 *
 * Link with -lquorvel, nothing else. docs/c.md is the guide; what an operation does, and its errors, stand here in
 * short and at quorvel::Recorder (<quorvel/Recorder.h>) in full.
 *
 * Memory. What the library hands to a handler or event lives until that returns. Counted things (errors, values,
 * samples) live longer where you retain them: each `retain` ends with one `release`, from any thread; both take NULL.
 * Structs that the library hands out may become longer at their end in later versions: use them by pointer, do not copy
 * them. Structs that you hand in begin with their size and are read during the call only; begin them with their
 * ..._INIT. Texts are UTF-8 and end in 0; a text that you hand in may be NULL, which is the empty one. No other pointer
 * may be NULL, unless it is said.
 *
 * Threads. Every function may be called from any thread, also in a handler. Handlers and events come one at a time and
 * in order: on a thread of the library, or, with a queue, in `quorvel_queue_run`. Never inside the call that brings
 * them about. They must not throw, nor leave by longjmp.
 *
 * Errors. A request with a handler ends in one call of it, with `error` NULL where it went well. Any request may bring
 * QUORVEL_ERROR_CONNECTION_INVALID (the daemon cannot be reached), _CONNECTION_INTERRUPTED (it went away meanwhile) or
 * _UNKNOWN (it refused the call; the text says why). Requests without an answer have a handler that is called with such
 * an error only. Every handler may be NULL. The other arguments of a handler are empty where it has an error, unless it
 * is said. Only running out of memory ends the program. */

#include <quorvel/c_types.h>
#include <sys/types.h>

#ifdef __cplusplus
extern "C" {
#endif

/* Work of the library that waits until your main loop runs it. ----------------------------------------------------- */

typedef struct quorvel_queue quorvel_queue;

/* NULL where the system has no descriptor left. */
QUORVEL_C_API quorvel_queue* quorvel_queue_create(void);
/* After the recorders that were made with it: what waits yet, or comes later, is thrown away. Takes NULL. */
QUORVEL_C_API void quorvel_queue_release(quorvel_queue* queue);
/* Readable (poll, epoll) while something waits. It belongs to the queue: do not read or close it. */
QUORVEL_C_API int quorvel_queue_get_descriptor(const quorvel_queue* queue);
/* Runs the handlers and events that wait now, and answers how many. One thread at a time; not in a handler. */
QUORVEL_C_API size_t quorvel_queue_run(quorvel_queue* queue);
/* The same, after waiting for the first: `milliseconds` at most, without end where that is negative. A signal that the
 * process handles ends the wait, too. */
QUORVEL_C_API size_t quorvel_queue_wait(quorvel_queue* queue, int milliseconds);

/* The recorder ------------------------------------------------------------------------------------------------------
 */

typedef struct quorvel_recorder quorvel_recorder;

typedef void (*quorvel_error_handler)(void* context, const quorvel_error* error);

/* What happens without having been asked for. Every entry may be NULL; each gets `context`. */
typedef struct quorvel_events {
  void* context;
  /* The recording ended, not by this application's stop or later start: an error, perhaps with a movie ("" without). */
  void (*stopped)(void* context, const quorvel_error* error, const char* movie_url);
  /* The daemon went away: outstanding requests have ended by then, and the recording, too. The next request connects.
   */
  void (*interrupted)(void* context);
  void (*connected)(void* context);
  /* With the system's entitlement: something begins or ends to be recorded, for whichever application. */
  void (*recording_state_changed)(void* context, bool recording);
  /* Of a broadcast: what its extension tells of its service (a dictionary), and where it can be watched. */
  void (*broadcast_service_info_changed)(void* context, const quorvel_value* info);
  void (*broadcast_url_changed)(void* context, const char* url);
  /* Of a capture: a picture, 60 a second at most; where 3 wait, a new one is dropped. Sound: where 64 wait. */
  void (*video_frame)(void* context, const quorvel_video_frame* frame);
  void (*audio_sample)(void* context, const quorvel_audio_sample* sample);
  /* No daemon sends this at present. */
  void (*recording_lock_interrupted)(void* context, const quorvel_error* error);
  /* With the system's entitlement: how long that has been recorded, without pauses, as "1:05". */
  void (*recording_timer_changed)(void* context, const char* time);
} quorvel_events;
#define QUORVEL_EVENTS_INIT \
  { NULL, NULL, NULL, NULL, NULL, NULL, NULL, NULL, NULL, NULL, NULL }

typedef struct quorvel_recorder_options {
  size_t size;
  quorvel_queue* queue;  /* where handlers and events wait; NULL: they come on a thread of the library */
  quorvel_events events; /* what later versions add stands last in it */
} quorvel_recorder_options;
#define QUORVEL_RECORDER_OPTIONS_INIT \
  { sizeof(quorvel_recorder_options), NULL, QUORVEL_EVENTS_INIT }

/* One for each application. It does nothing yet: the first request connects. `options` may be NULL. */
QUORVEL_C_API quorvel_recorder* quorvel_recorder_create(const quorvel_recorder_options* options);
/* Ends the connection, and with it the recording, whose movie is deleted: stop first. No handler or event runs after it
 * has returned; requests that had not ended then never call theirs. It waits for a handler that runs, except in that
 * one itself. Takes NULL. */
QUORVEL_C_API void quorvel_recorder_destroy(quorvel_recorder* recorder);

/* Recording */

typedef struct quorvel_start_options {
  size_t size;
  const uint32_t* windows; /* to record: X11 window ids on X11; not read where `system` is set */
  size_t window_count;     /* 64 at most, each of this application */
  double width, height;    /* of the recorded picture in pixels, 1 to 1 000 000; a large one is scaled down */
  bool microphone;         /* ask for the microphone too */
  bool camera;             /* ask for the camera too; the daemon opens none at present */
  bool broadcast;          /* send to the extension that was set up instead of into a movie */
  bool system;             /* the whole screen; needs the entitlement "com.tarnwick.private.quorvel" */
  bool capture;            /* no movie: samples come to the events `video_frame` and `audio_sample` */
  int listener_endpoint;   /* a broadcast extension's endpoint, which is duplicated; -1: none */
} quorvel_start_options;
#define QUORVEL_START_OPTIONS_INIT \
  { sizeof(quorvel_start_options), NULL, 0, 0, 0, false, false, false, false, false, -1 }

/* What is recorded: asked for, there on the device, and allowed by the user. */
typedef void (*quorvel_start_handler)(void* context, const quorvel_error* error, bool microphone, bool camera);
/* `movie_url` is "file:///...", and "" where there is no movie: with an error, and after a capture or a broadcast. With
 * an error of the disk there may be one, which ends early. To read it: quorvel_recorder_open_movie. */
typedef void (*quorvel_stop_handler)(void* context, const quorvel_error* error, const char* movie_url);
/* `file` is open for reading at the movie's start, and belongs to the handler: close it. -1 with an error. */
typedef void (*quorvel_open_movie_handler)(void* context, const quorvel_error* error, int file);

/* Asks the user where needed, and starts. The application must be in front, unless it records the system. Whatever
 * records on the device is ended. */
QUORVEL_C_API void quorvel_recorder_start(quorvel_recorder* recorder, const quorvel_start_options* options,
                                          quorvel_start_handler handler, void* context);
/* Ends the recording; the answer comes when its movie is complete. */
QUORVEL_C_API void quorvel_recorder_stop(quorvel_recorder* recorder, quorvel_stop_handler handler, void* context);
/* And cuts so many seconds off the movie's start and end, where both are positive. */
QUORVEL_C_API void quorvel_recorder_stop_trimmed(quorvel_recorder* recorder, double start_seconds, double end_seconds,
                                                 quorvel_stop_handler handler, void* context);
/* Nothing is recorded until `resume`, from which on `window` is. A broadcast stays paused until its stop. */
QUORVEL_C_API void quorvel_recorder_pause(quorvel_recorder* recorder, quorvel_error_handler on_failure, void* context);
QUORVEL_C_API void quorvel_recorder_resume(quorvel_recorder* recorder, uint32_t window,
                                           quorvel_error_handler on_failure, void* context);
/* During a recording: false puts silence in place of the microphone's sound. */
QUORVEL_C_API void quorvel_recorder_set_microphone_enabled(quorvel_recorder* recorder, bool enabled,
                                                           quorvel_error_handler on_failure, void* context);
/* During a recording: records the sound of process `pid` from here on; of nobody with 0 or less. */
QUORVEL_C_API void quorvel_recorder_update_process_id_for_audio_capture(quorvel_recorder* recorder, pid_t pid,
                                                                        quorvel_error_handler on_failure,
                                                                        void* context);
/* Deletes the movie that was handed last, unless it is saved; no error where there is none. */
QUORVEL_C_API void quorvel_recorder_discard(quorvel_recorder* recorder, quorvel_error_handler handler, void* context);
/* Moves a movie to the user's photo library. */
QUORVEL_C_API void quorvel_recorder_save_video_to_camera_roll(quorvel_recorder* recorder, const char* movie_url,
                                                              quorvel_error_handler handler, void* context);
/* Opens a movie of this application's. It stays readable, also when it is saved, discarded or replaced meanwhile. */
QUORVEL_C_API void quorvel_recorder_open_movie(quorvel_recorder* recorder, const char* movie_url,
                                               quorvel_open_movie_handler handler, void* context);

/* What the daemon knows of this application; all of it empty where the application is in no bundle. */
typedef struct quorvel_state {
  bool recording; /* from the user's consent on, in a pause too */
  bool broadcasting;
  bool microphone_enabled;
  bool system_recording;
  bool user_consent_for_microphone;
  bool user_consent_for_camera;
  bool microphone_enabled_persistent;
  const char* broadcast_url; /* NULL: none */
} quorvel_state;
/* `state` is NULL with an error. */
typedef void (*quorvel_state_handler)(void* context, const quorvel_error* error, const quorvel_state* state);
QUORVEL_C_API void quorvel_recorder_current_state(quorvel_recorder* recorder, quorvel_state_handler handler,
                                                  void* context);

/* The application's place: tell when it comes to the front, and when it leaves it. */
QUORVEL_C_API void quorvel_recorder_did_become_active(quorvel_recorder* recorder, quorvel_error_handler on_failure,
                                                      void* context);
QUORVEL_C_API void quorvel_recorder_did_resign_active(quorvel_recorder* recorder, quorvel_error_handler on_failure,
                                                      void* context);
/* While on, a lost daemon is looked for again; off at first. */
QUORVEL_C_API void quorvel_recorder_keep_connected(quorvel_recorder* recorder, bool keep);

/* Broadcasts */

typedef struct quorvel_broadcast_options {
  size_t size;
  const char* host_bundle_id;      /* this application's own */
  const char* extension_bundle_id; /* the first installed extension that begins so, but for the last component */
  double clip_duration;            /* seconds of a clip, 0.5 to 600; 0: 5 s */
  const quorvel_value* video_compression_properties; /* of clips: a dictionary (docs/protocol.md), or NULL */
  const quorvel_value* user_info;                    /* handed to the extension: a dictionary, or NULL */
} quorvel_broadcast_options;
#define QUORVEL_BROADCAST_OPTIONS_INIT \
  { sizeof(quorvel_broadcast_options), NULL, NULL, 0, NULL, NULL }

/* Names the extension of the next broadcast, and what it is told. For one broadcast. */
QUORVEL_C_API void quorvel_recorder_setup_broadcast(quorvel_recorder* recorder,
                                                    const quorvel_broadcast_options* options,
                                                    quorvel_error_handler handler, void* context);
/* PNG, of the application and the extension that were set up last; of size 0 where there is none. */
typedef void (*quorvel_broadcast_images_handler)(void* context, const quorvel_error* error, const void* host_app,
                                                 size_t host_app_size, const void* extension, size_t extension_size);
QUORVEL_C_API void quorvel_recorder_current_broadcast_images(quorvel_recorder* recorder,
                                                             quorvel_broadcast_images_handler handler, void* context);
/* The installed upload extensions: a list of dictionaries with "bundleID" (text) and, where there are such,
 * "displayName" (text) and "icon" (bytes: PNG). */
typedef void (*quorvel_value_handler)(void* context, const quorvel_error* error, const quorvel_value* value);
QUORVEL_C_API void quorvel_recorder_system_broadcast_extensions(quorvel_recorder* recorder,
                                                                quorvel_value_handler handler, void* context);
/* Sets the state's broadcast URL; "" takes it away. */
QUORVEL_C_API void quorvel_recorder_set_broadcast_url(quorvel_recorder* recorder, const char* url,
                                                      quorvel_error_handler on_failure, void* context);

/* Remembered by the daemon while the application is connected, and shown in the state; without another effect. */
QUORVEL_C_API void quorvel_recorder_set_has_user_consent_for_camera(quorvel_recorder* recorder, bool consent,
                                                                    quorvel_error_handler on_failure, void* context);
QUORVEL_C_API void quorvel_recorder_set_has_user_consent_for_microphone(quorvel_recorder* recorder, bool consent,
                                                                        quorvel_error_handler on_failure,
                                                                        void* context);
QUORVEL_C_API void quorvel_recorder_set_microphone_enabled_persistent(quorvel_recorder* recorder, bool enabled,
                                                                      quorvel_error_handler on_failure, void* context);
/* During a recording: the application uses a camera, 1 the back one, 2 the front one. It goes into the metrics. */
QUORVEL_C_API void quorvel_recorder_report_camera_usage(quorvel_recorder* recorder, int32_t camera_position,
                                                        quorvel_error_handler on_failure, void* context);

/* Captured samples that were dropped because the handlers did not keep up, over the recorder's life. */
QUORVEL_C_API uint64_t quorvel_recorder_get_dropped_samples(const quorvel_recorder* recorder);

/* The path of a "file:///..." URL as snprintf does it: at most `size` bytes with the 0 go to `buffer` (NULL where
 * `size` is 0), and its whole length without the 0 is answered; 0 for any other URL. */
QUORVEL_C_API size_t quorvel_file_path(const char* url, char* buffer, size_t size);

/* What the daemon does, for status displays and tools ----------------------------------------------------------------
 */

/* Use it in a process of no bundle: an application's connection and its recorder's would replace each other. Its
 * handlers come on a thread of the library. */
typedef struct quorvel_status_reader quorvel_status_reader;

QUORVEL_C_API quorvel_status_reader* quorvel_status_reader_create(void);
/* No handler runs after it has returned. Not in one of its handlers. Takes NULL. */
QUORVEL_C_API void quorvel_status_reader_destroy(quorvel_status_reader* reader);
/* Each answers a list of dictionaries (NULL with an error), whose keys are in docs/protocol.md, "Status". */
QUORVEL_C_API void quorvel_status_reader_recordings(quorvel_status_reader* reader, quorvel_value_handler handler,
                                                    void* context);
QUORVEL_C_API void quorvel_status_reader_start_conditions(quorvel_status_reader* reader, const char* bundle_id,
                                                          bool system, bool microphone, quorvel_value_handler handler,
                                                          void* context);
QUORVEL_C_API void quorvel_status_reader_movies(quorvel_status_reader* reader, quorvel_value_handler handler,
                                                void* context);
/* Of the one device. */
QUORVEL_C_API void quorvel_status_reader_device(quorvel_status_reader* reader, quorvel_value_handler handler,
                                                void* context);

#ifdef __cplusplus
}
#endif
