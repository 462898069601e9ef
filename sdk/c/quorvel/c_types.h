#pragma once

/* What the C interface hands out and takes: errors, values, samples. Included by <quorvel/quorvel.h>, whose head has
 * the rules of memory, threads and errors. C11 and C++. */

#include <stdbool.h>
#include <stddef.h>
#include <stdint.h>

#define QUORVEL_C_API __attribute__((visibility("default"), nothrow))

#ifdef __cplusplus
extern "C" {
#endif

/* Errors ------------------------------------------------------------------------------------------------------------
 */

/* Codes of the domain QUORVEL_ERROR_DOMAIN. docs/errors.md tells of each what to do. */
enum {
  QUORVEL_ERROR_UNKNOWN = -5800,                   /* anything else; the text says more */
  QUORVEL_ERROR_USER_DECLINED = -5801,             /* the user said no: do not ask again by yourself */
  QUORVEL_ERROR_DISABLED = -5802,                  /* recording is switched off on this device */
  QUORVEL_ERROR_FAILED_TO_START = -5803,           /* not in front, no bundle, or a window that is not yours */
  QUORVEL_ERROR_FAILED = -5804,                    /* the recording broke off */
  QUORVEL_ERROR_INSUFFICIENT_STORAGE = -5805,      /* too little free space */
  QUORVEL_ERROR_INTERRUPTED = -5806,               /* another recording took over, or the application left the front */
  QUORVEL_ERROR_CONTENT_RESIZE = -5807,            /* the picture's size changed */
  QUORVEL_ERROR_INVALID_BROADCAST_SESSION = -5808, /* no broadcast was set up, or its extension is gone */
  QUORVEL_ERROR_SYSTEM_DORMANCY = -5809,           /* the device went to sleep */
  QUORVEL_ERROR_ENTITLEMENTS = -5810,              /* the application lacks the right to do this */
  QUORVEL_ERROR_ACTIVE_PHONE_CALL = -5811,         /* not raised at present */
  QUORVEL_ERROR_FAILED_TO_SAVE = -5812,            /* the movie could not be written */
  QUORVEL_ERROR_DASHVEX = -5813,                   /* not raised at present */
  QUORVEL_ERROR_CONNECTION_INVALID = -5814,        /* the daemon cannot be reached */
  QUORVEL_ERROR_CONNECTION_INTERRUPTED = -5815,    /* the daemon went away meanwhile; a recording is lost */
  QUORVEL_ERROR_NO_CONTEXT_ID_MATCH = -5816,       /* resumed with a window that is not yours */
  QUORVEL_ERROR_MEDIA_SERVICES_FAILED = -5817,     /* screen or sound capture failed */
  QUORVEL_ERROR_MIXING_FAILURE = -5818             /* not raised at present */
};

#define QUORVEL_ERROR_DOMAIN "com.tarnwick.Quorvel.QVRecordingErrorDomain"

/* What went wrong. Counted. */
typedef struct quorvel_error {
  int64_t code;     /* in QUORVEL_ERROR_DOMAIN one of the above; elsewhere the domain's own, e.g. an errno in "posix" */
  const char* key;  /* the code's name for a log, e.g. "RECORDING_ERROR_USER_DECLINED" */
  const char* text; /* UTF-8, for the user, in the user's language where it comes from the daemon; else English */
  const char* domain; /* never NULL, as the other two */
} quorvel_error;

QUORVEL_C_API const quorvel_error* quorvel_error_retain(const quorvel_error* error);
QUORVEL_C_API void quorvel_error_release(const quorvel_error* error);
/* The name of a code of QUORVEL_ERROR_DOMAIN; that of QUORVEL_ERROR_UNKNOWN for any other. It lives for ever. */
QUORVEL_C_API const char* quorvel_error_key(int64_t code);

/* Values ------------------------------------------------------------------------------------------------------------
 */

/* User information of broadcasts, and answers of the status reader. Counted. Values are built by their one owner, and
 * do not change any more once another thread or a request of this library has them. */
typedef struct quorvel_value quorvel_value;

typedef enum quorvel_value_type {
  QUORVEL_VALUE_NONE = 0,
  QUORVEL_VALUE_BOOL,
  QUORVEL_VALUE_INTEGER,
  QUORVEL_VALUE_REAL,
  QUORVEL_VALUE_TEXT,
  QUORVEL_VALUE_BYTES,
  QUORVEL_VALUE_LIST,
  QUORVEL_VALUE_DICTIONARY
} quorvel_value_type;

/* New values, with one reference for the caller. Texts and bytes are copied; a NULL text is the empty one. */
QUORVEL_C_API quorvel_value* quorvel_value_create_bool(bool value);
QUORVEL_C_API quorvel_value* quorvel_value_create_integer(int64_t value);
QUORVEL_C_API quorvel_value* quorvel_value_create_real(double value);
QUORVEL_C_API quorvel_value* quorvel_value_create_text(const char* text);
QUORVEL_C_API quorvel_value* quorvel_value_create_bytes(const void* bytes, size_t size);
QUORVEL_C_API quorvel_value* quorvel_value_create_list(void);
QUORVEL_C_API quorvel_value* quorvel_value_create_dictionary(void);
QUORVEL_C_API const quorvel_value* quorvel_value_retain(const quorvel_value* value);
QUORVEL_C_API void quorvel_value_release(const quorvel_value* value);

/* These take over the caller's reference of `value`, also where they fail: so a new value can stand in the call. False
 * where the first is no list or dictionary, where `value` is NULL, or where it has the first somewhere inside. */
QUORVEL_C_API bool quorvel_list_append(quorvel_value* list, quorvel_value* value);
QUORVEL_C_API bool quorvel_dictionary_set(quorvel_value* dictionary, const char* key, quorvel_value* value);

/* What a value is, and its content. Each answers false, 0, or NULL where the value is of another type, or NULL; what it
 * answers lives as long as the value that it was asked of. */
QUORVEL_C_API quorvel_value_type quorvel_value_get_type(const quorvel_value* value);
QUORVEL_C_API bool quorvel_value_get_bool(const quorvel_value* value);
QUORVEL_C_API int64_t quorvel_value_get_integer(const quorvel_value* value);
QUORVEL_C_API double quorvel_value_get_real(const quorvel_value* value); /* of an integer, too */
QUORVEL_C_API const char* quorvel_value_get_text(const quorvel_value* value);
QUORVEL_C_API const void* quorvel_value_get_bytes(const quorvel_value* value, size_t* size);
/* Of a list or a dictionary: how many entries; the entry at a place below that, and its key in a dictionary, whose
 * entries are in the order of their keys. */
QUORVEL_C_API size_t quorvel_value_get_count(const quorvel_value* value);
QUORVEL_C_API const quorvel_value* quorvel_value_get_entry(const quorvel_value* value, size_t place);
QUORVEL_C_API const char* quorvel_dictionary_get_key(const quorvel_value* dictionary, size_t place);
QUORVEL_C_API const quorvel_value* quorvel_dictionary_get(const quorvel_value* dictionary, const char* key);

/* Samples -----------------------------------------------------------------------------------------------------------
 */

/* Times are nanoseconds of CLOCK_MONOTONIC at the capture, less the pauses so far. */
#define QUORVEL_NO_DURATION INT64_C(-1)

/* A captured picture. Counted. Its pixels are shared with the daemon, which has few such frames: the last reference
 * gives the frame back. Release it within a frame or two, and copy out what you want to keep. */
typedef struct quorvel_video_frame {
  const uint8_t* pixels;     /* `height` rows from the top, each of `stride` bytes; read-only */
  uint32_t width, height;    /* in pixels of 4 bytes: blue, green, red, and one without meaning */
  uint32_t stride;           /* bytes from one row to the next, at least 4 * width */
  int64_t presentation_time; /* when it is shown */
  int64_t duration;          /* how long, or QUORVEL_NO_DURATION, as mostly */
} quorvel_video_frame;

QUORVEL_C_API const quorvel_video_frame* quorvel_video_frame_retain(const quorvel_video_frame* frame);
QUORVEL_C_API void quorvel_video_frame_release(const quorvel_video_frame* frame);

typedef enum quorvel_audio_source { QUORVEL_AUDIO_APPLICATION = 0, QUORVEL_AUDIO_MICROPHONE = 1 } quorvel_audio_source;

/* A run of captured sound: linear PCM, channels interleaved. Its format may differ from one sample to the next.
 * Counted. */
typedef struct quorvel_audio_sample {
  quorvel_audio_source source;
  const uint8_t* bytes; /* at least frame_count * bytes_per_frame */
  size_t size;
  int64_t frame_count;
  int64_t presentation_time; /* of its first frame */
  int64_t duration;          /* or QUORVEL_NO_DURATION: it follows from frames and rate then */
  double sample_rate;        /* frames a second */
  uint32_t channels;         /* numbers in a frame */
  uint32_t bits_per_channel; /* of one number */
  uint32_t bytes_per_frame;
  bool is_float;      /* IEEE numbers, otherwise integers */
  bool is_signed;     /* of integers */
  bool is_big_endian; /* the order of the bytes of a number */
} quorvel_audio_sample;

QUORVEL_C_API const quorvel_audio_sample* quorvel_audio_sample_retain(const quorvel_audio_sample* sample);
QUORVEL_C_API void quorvel_audio_sample_release(const quorvel_audio_sample* sample);

#ifdef __cplusplus
}
#endif
