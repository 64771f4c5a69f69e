#ifndef LIBRARY_CALMFRAME_H_
#define LIBRARY_CALMFRAME_H_

#include <stddef.h>
#include <stdint.h>

/* Steadies shaky video whose frames are the caller's: frames go in, are analysed and solved, and
   every frame can then be drawn steady, in any order, from several threads.

   A session is one clip. Its frames are pushed in order, or fetched from the caller by a function;
   the work runs on threads of the session's own meanwhile:

     calmframe_options options;
     calmframe_session session;
     calmframe_options_init(&options);
     options.width = 1280;
     options.height = 720;
     options.rate_num = 30;
     options.frame_count = 240;
     calmframe_open(&options, &session);
     for (n = 0; n < 240; ++n) calmframe_push(session, n, &frames[n]);
     calmframe_finish(session);
     calmframe_wait(session, -1);
     for (n = 0; n < 240; ++n) calmframe_render(session, n, &frames[n], &steady);
     calmframe_close(session);

   Every function may be called from any thread, and ends with a code: CALMFRAME_OK, or what went
   wrong, of which calmframe_error_text has a line. No C++ exception leaves the library, and memory
   that runs out is a code. A handle that was closed, or never was one, is CALMFRAME_ERROR_ARGUMENT.

   Any number of sessions may be open at once. They share the processors and nothing else. */

#if defined(__GNUC__)
#define CALMFRAME_API __attribute__((visibility("default")))
#else
#define CALMFRAME_API
#endif

#ifdef __cplusplus
extern "C" {
#endif

/* ---- Codes ---- */

typedef int32_t calmframe_result;
enum {
  CALMFRAME_OK = 0,
  CALMFRAME_AGAIN = 1,           /* not yet: no room for a frame, or the time was up; no error */
  CALMFRAME_ERROR_ARGUMENT = -1, /* null, a wrong size or name, no session; nothing was done */
  CALMFRAME_ERROR_STATE = -2,    /* a call out of its order; nothing was done */
  CALMFRAME_ERROR_BUSY = -3,     /* another thread is in the same call */
  CALMFRAME_ERROR_MEMORY = -4,
  CALMFRAME_ERROR_PLUGIN = -5, /* the stabilizer's plug-in is not there, or doesn't start */
  CALMFRAME_ERROR_SOURCE = -6, /* a frame could not be had: refused by the caller, or gone */
  CALMFRAME_ERROR_SOLVE = -7,  /* the clip could not be analysed or steadied */
  CALMFRAME_ERROR_CANCELLED = -8,
  CALMFRAME_ERROR_FILE = -9,     /* saved work: not there, damaged, newer, of another clip */
  CALMFRAME_ERROR_INTERNAL = -10 /* a fault of the library's */
};

/* "0.1.0". */
CALMFRAME_API const char* calmframe_version(void);

/* "CALMFRAME_ERROR_BUSY"; "?" for what is no code. */
CALMFRAME_API const char* calmframe_result_name(calmframe_result result);

/* ---- Opening ---- */

/* How a frame lies in memory. `depth` of the options tells the bits of a component: packed formats
   have 8, 16 (0 to 65535, in this machine's byte order) or 32 (float, 0 to 1 nominal), planar
   ones 8, 10, 12 or 16, above 8 as 16-bit words with the value in the lower bits. Alpha is straight
   (not premultiplied); without alpha pixels are opaque, and what is drawn stands over black. */
enum {
  CALMFRAME_RGBA = 0, /* components in the order of memory, whatever the machine */
  CALMFRAME_BGRA = 1,
  CALMFRAME_ARGB = 2, /* as the stabilizer has it: at 8 and 32 bits it is spared a conversion */
  CALMFRAME_RGB = 3,
  CALMFRAME_BGR = 4,
  CALMFRAME_YUV420P = 5, /* three planes: luma, blue and red difference; sides must be even */
  CALMFRAME_YUV422P = 6, /* width must be even */
  CALMFRAME_YUV444P = 7
};

/* A frame, of the session's size, format and depth. */
typedef struct calmframe_image {
  int32_t width, height; /* pixels; those of the session */
  void* plane[3];        /* the top row of each plane; packed formats have one. Images that are
                            put in are only read */
  ptrdiff_t stride[3];   /* bytes from one row of a plane to the next; below 0 for pictures that
                            are stored bottom row first */
} calmframe_image;

/* Fetches frame `frame`, 0 to frame_count - 1, into `image`, all of whose rows are to be written.
   0: it is there; any other number: it can't be had, which ends the work with
   CALMFRAME_ERROR_SOURCE. Called on the session's threads and on those that render, never twice at
   a time. While the clip is worked frames are asked for in order, each once, but for those about
   the border of two shots. It may call nothing of this library but calmframe_cancel,
   calmframe_get_progress and calmframe_get_state on its own session, and must come back: what it
   throws counts as any other number, while longjmp would leave locks held. */
typedef int32_t (*calmframe_fetch)(void* user, int64_t frame, calmframe_image* image);

/* Which shots a clip has; each is steadied by itself. */
enum {
  CALMFRAME_SHOTS_BY_SOURCE = 0, /* found where frames are fetched; one where they are pushed */
  CALMFRAME_SHOTS_ONE = 1,
  CALMFRAME_SHOTS_FOUND = 2, /* cuts, dissolves and fades; takes `fetch` */
  CALMFRAME_SHOTS_LIST = 3   /* `shot_starts` */
};

typedef struct calmframe_options {
  uint32_t struct_size; /* set by calmframe_options_init */

  int32_t width, height; /* of a frame, at least 20 pixels each */
  int32_t format;        /* CALMFRAME_RGBA ... */
  int32_t depth;         /* bits of a component; 8 at first */
  /* What a YUV frame's numbers mean, ITU-T H.273 code points: 1 is BT.709, 5 and 6 BT.601, 9
     BT.2020; 2, as at first, is BT.709 from 720 rows or 1280 columns on, BT.601 below. */
  int32_t matrix;
  int32_t full_range; /* of YUV: 0 limited, as at first; 1 full */
  /* Where a sample of 4:2:0 chroma lies: 1 left, as at first, 2 centre, 3 top left. */
  int32_t chroma_location;

  int32_t aspect_num, aspect_den; /* width : height of one pixel; 1 : 1 at first */
  int32_t rate_num, rate_den;     /* frames a second; 25 : 1 at first */
  /* 0 progressive, as at first; 1 the top field was shot first; 2 the bottom field. */
  int32_t field_order;

  /* How many frames there are, 1 at least. Where they are pushed: how many there are at most;
     calmframe_finish may come earlier, and what it leaves open costs 8 KiB of memory a frame until
     then. */
  int64_t frame_count;

  int32_t shots;              /* CALMFRAME_SHOTS_BY_SOURCE ... */
  const int64_t* shot_starts; /* the first frames of all shots but the first, ascending */
  size_t shot_start_count;

  calmframe_fetch fetch; /* null: the frames are pushed */
  void* user;            /* goes to `fetch` */

  /* The file that the frames come from, which the library never decodes: it tells saved work of
     one clip from that of another, so that projects of this file may be exchanged with the
     program. Null: `identity` does. */
  const char* clip;
  /* Any text that is the same for the same frames. Null: size and rate alone. */
  const char* identity;

  /* The plug-in, calmframe.hxp. Null: where CALMFRAME_PLUGIN of the environment says, else where it
     was installed with the library. */
  const char* plugin;
} calmframe_options;

/* Sets all members as they are "at first" above, or to 0. */
CALMFRAME_API void calmframe_options_init(calmframe_options* options);

/* A handle. Its number is never given twice in a process; 0 is none. */
typedef struct calmframe_session_number* calmframe_session;

/* Opens a session; what the options point at may go afterwards, but for `user`. On an error
 *session is 0 and calmframe_error_text(0, ...) tells the cause on this thread. */
CALMFRAME_API calmframe_result calmframe_open(const calmframe_options* options,
                                              calmframe_session* session);

/* Ends the work, wherever it is, and the session. Returns when nothing of it runs any more; a call
   that another thread is in ends with CALMFRAME_ERROR_CANCELLED. CALMFRAME_ERROR_STATE inside
   `fetch`. */
CALMFRAME_API calmframe_result calmframe_close(calmframe_session session);

/* ---- Controls ---- */

/* Sets a control, to be had with the next calmframe_start, or first push. Names and values are
   those of `calmframe params` ("Smoothness" "80", "Framing" "Stabilize Only", "Detailed Analysis"
   "on"), the experimental ones too, case apart; and of the flags of `calmframe stabilize`:

     "window"        "auto" | "follow" | "steady"
     "zoom-at-most"  a number, 1 to 100; "0" as Maximum Scale has it
     "zoom-speed"    percent a second, 0 to 1000; "" as it comes
     "steady"        "auto" | "background" | "subject"
     "as-set"        "on" | "off"

   As it comes what nobody set is chosen for the clip, as the program does. Errors: ARGUMENT, with
   the nearest name or the range; STATE while the clip is worked. */
CALMFRAME_API calmframe_result calmframe_set(calmframe_session session, const char* name,
                                             const char* value);

/* All controls: an array of objects with "name", "kind" ("slider", "popup", "checkbox"), "min" and
   "max" or "items", "default", "experimental" and "value", which is null for one that nobody set.
   *json is to be given to calmframe_free. */
CALMFRAME_API calmframe_result calmframe_get_controls(calmframe_session session, char** json);

/* ---- Working ---- */

enum {
  CALMFRAME_IDLE = 0,    /* nothing was begun */
  CALMFRAME_WORKING = 1, /* it takes frames, analyses, solves or chooses */
  CALMFRAME_SOLVED = 2,  /* frames can be drawn */
  CALMFRAME_FAILED = 3,
  CALMFRAME_CANCELLED = 4
};

/* Begins the work with the controls as they are. What was done before and still stands is not done
   again: with other controls a solved clip is only solved anew, which asks for no frame unless
   Detailed Analysis changes. The first push begins by itself. STATE: it is being worked; or it is
   pushed, and was cancelled or failed before its last frame. */
CALMFRAME_API calmframe_result calmframe_start(calmframe_session session);

/* Gives the next frame: `frame` counts from 0 without a gap. Returns when the session has taken
   what it needs of the image; it blocks while the analysis is some frames behind, which is how
   fast frames may come. Errors: ARGUMENT, another number than the next, or an image of another
   size; STATE, frames are fetched, or it is finished; BUSY, another thread is pushing; CANCELLED;
   and what ended the work. */
CALMFRAME_API calmframe_result calmframe_push(calmframe_session session, int64_t frame,
                                              const calmframe_image* image);

/* The same without waiting: CALMFRAME_AGAIN where there is no room, and the frame was not taken. */
CALMFRAME_API calmframe_result calmframe_try_push(calmframe_session session, int64_t frame,
                                                  const calmframe_image* image);

/* There are no more frames than were pushed. STATE: none was. */
CALMFRAME_API calmframe_result calmframe_finish(calmframe_session session);

/* Waits until the work has ended, `milliseconds` long, below 0 for ever. OK: the clip is solved;
   AGAIN: the time is up; else what ended the work. STATE: nothing was begun. */
CALMFRAME_API calmframe_result calmframe_wait(calmframe_session session, int64_t milliseconds);

/* Ends the work at its next step; calls that wait end with CALMFRAME_ERROR_CANCELLED. A clip whose
   frames are fetched may be started again; what was whole stands. Without work it does nothing. */
CALMFRAME_API calmframe_result calmframe_cancel(calmframe_session session);

CALMFRAME_API calmframe_result calmframe_get_state(calmframe_session session, int32_t* state);

typedef struct calmframe_progress {
  char stage[24];     /* "analyzing", "solving", "choosing", "drawing"; empty: none has begun */
  int32_t shot;       /* that is worked, from 0 */
  double done, total; /* of the stage: frames while analysing, else a share; total 0: unknown */
  char says[96];      /* what the stabilizer says of it; may be empty */
} calmframe_progress;

CALMFRAME_API calmframe_result calmframe_get_progress(calmframe_session session,
                                                      calmframe_progress* progress);

/* Copies the line that tells of the last error in this session, whichever thread it was on; with
   session 0 of the last error on this thread that no session stands for. UTF-8, cut to `size` bytes
   with the 0 at its end; empty where there was none. Returns the whole line's length. */
CALMFRAME_API size_t calmframe_error_text(calmframe_session session, char* text, size_t size);

/* ---- What was solved; STATE until it is ---- */

enum { CALMFRAME_WINDOW_STEADY = 0, CALMFRAME_WINDOW_FOLLOW = 1, CALMFRAME_WINDOW_NONE = 2 };

/* Shake: motion faster than about 0.9 Hz, in thousandths of the picture's width. */
typedef struct calmframe_shake {
  double mean;     /* over the frames */
  double p95;      /* that a twentieth of the frames exceed */
  double worst;    /* of the worst second */
  double worst_at; /* its middle, in seconds from the first frame */
} calmframe_shake;

/* What the steady frames show. */
typedef struct calmframe_outcome {
  int32_t window; /* CALMFRAME_WINDOW_...: the effect's own, one that follows the picture, the whole
                     frame as it was filmed */
  int32_t bends;  /* 1: frames are warped as solved; 0: as they were shot, moved and turned */
  double width_kept; /* share of the source's width that is shown, mean over the frames */
  double most_zoom;  /* of the frame that is enlarged most */
  double most_black; /* share of the frame that shows the least, 0 to 1 */
  double decibels;   /* by how much the mean shake has fallen */
  calmframe_shake before, after;
  double wobble_before, wobble_after; /* flicker of the picture's own shape, as shake */
  double tracks_before, tracks_after; /* mean shake of all that was tracked, near and far */
} calmframe_outcome;

typedef struct calmframe_shot {
  int64_t first, end; /* frames, the end excluded */
  int32_t solved;     /* 0: it could not be steadied, and stays as it was filmed */
  calmframe_outcome outcome;
} calmframe_shot;

CALMFRAME_API calmframe_result calmframe_get_shot_count(calmframe_session session, size_t* count);
CALMFRAME_API calmframe_result calmframe_get_shot(calmframe_session session, size_t number,
                                                  calmframe_shot* shot);
/* Of the clip as a whole: means over the shots that are solved, weighed by frames; the greatest
   zoom and black. */
CALMFRAME_API calmframe_result calmframe_get_outcome(calmframe_session session,
                                                     calmframe_outcome* outcome);

/* (x, y) -> (a x - b y + dx, b x + a y + dy). */
typedef struct calmframe_similarity {
  double a, b, dx, dy;
} calmframe_similarity;

/* A frame's place on the path. Square pixels (a pixel that is wider than high counts as several),
   about the middle of the frame, x to the right, y down. */
typedef struct calmframe_place {
  /* Takes a point of the background to its place in the frame before, as filmed and as it is
     shown; without meaning of a shot's first frame. */
  calmframe_similarity before, after;
  double zoom;  /* how many times enlarged the source is shown */
  double black; /* share of the frame where the source shows nothing, 0 to 1 */
  /* Where in the source's frame the middle of the window lies that is shown; no numbers where the
     frame's warp is folded. */
  double centre_x, centre_y;
  /* How far the middle may go before the window leaves the frame. */
  double least_x, least_y, most_x, most_y;
} calmframe_place;

/* The places of `count` frames from `first` on. Of an interlaced clip those of the field that was
   shot first. Frames of a shot that is not solved have zoom 1 and no motion. */
CALMFRAME_API calmframe_result calmframe_get_path(calmframe_session session, int64_t first,
                                                  int64_t count, calmframe_place* places);

/* All of it but the path, and what was chosen of what: an object with the outcome's members,
   "warnings", an array of lines, and "shots", an array of objects with "first_frame", "end_frame",
   the outcome's members, and "choice". *json is to be given to calmframe_free. */
CALMFRAME_API calmframe_result calmframe_get_report(calmframe_session session, char** json);

/* ---- Drawing ---- */

/* Draws frame `frame` steady into `out`. `source`: the frame as it was shot, or null, where `fetch`
   is asked for it. It must be the same picture that was analysed; one that was handed in is taken
   for that frame as long as the library keeps it in mind. Any number of threads at once and any
   order; frames in ascending order on several threads are fastest, and each change to another shot
   takes some time. A framing that fills the edges (Framing "Synthesize Edges") looks at other
   frames too, so it takes `fetch`. */
CALMFRAME_API calmframe_result calmframe_render(calmframe_session session, int64_t frame,
                                                const calmframe_image* source,
                                                const calmframe_image* out);

/* ---- Saved work ---- */

/* What frames saved work is of. */
typedef struct calmframe_saved {
  int32_t width, height;
  int32_t aspect_num, aspect_den;
  int32_t rate_num, rate_den;
  int64_t frame_count;
} calmframe_saved;

/* Tells what a project file is of, so that a session can be opened to take it up. FILE: it is not
   there, or none, damaged or newer. */
CALMFRAME_API calmframe_result calmframe_get_saved_file(const char* path, calmframe_saved* saved);

/* Writes what was solved to a project file, as the program does, or to bytes of the same content,
   to be given to calmframe_free. STATE: nothing is solved. */
CALMFRAME_API calmframe_result calmframe_save_file(calmframe_session session, const char* path);
CALMFRAME_API calmframe_result calmframe_save(calmframe_session session, void** bytes,
                                              size_t* size);

/* Takes saved work up, before any start or push: calmframe_start then does only what doesn't stand
   any more, with the controls that were saved, and asks for no frame unless it has to analyse.
   FILE: not there, damaged, or of another clip: of another size, rate, `clip` or `identity`, or of
   more frames. */
CALMFRAME_API calmframe_result calmframe_load_file(calmframe_session session, const char* path);
CALMFRAME_API calmframe_result calmframe_load(calmframe_session session, const void* bytes,
                                              size_t size);

/* Of what a function of this library has made; null is nothing. */
CALMFRAME_API void calmframe_free(void* memory);

#ifdef __cplusplus
}
#endif

#endif
