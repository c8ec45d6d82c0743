/* zafrel-host: present the Zafrel video editor from a program of your own (a screen recorder, say).
 *
 * The editor runs as a process of its own, the extension; a session starts it on a recorded movie,
 * hands it the recording's details, and tells you what the user did with the movie (saved it,
 * shared it, published it, or nothing) before the extension ends. The editor's save removes the
 * movie it was handed: hand it a file it may consume.
 *
 * A session never blocks and has no thread of its own. Add zafrel_host_session_fd() to your event
 * loop (poll, a GLib source with g_unix_fd_add, SDL, ...) and call zafrel_host_session_dispatch()
 * whenever it is readable; every callback runs inside dispatch, on the thread that calls it. A
 * program without a loop of its own calls zafrel_host_session_run(), which does that until the
 * extension has ended.
 *
 * A typical run:
 *
 *     zafrel_host_session *session = zafrel_host_session_new();
 *     zafrel_host_session_add_item(session, ZAFREL_HOST_MOVIE_KEY, "/home/me/Videos/rec.mp4");
 *     zafrel_host_session_add_item(session, ZAFREL_HOST_APP_NAME_KEY, "My Recorder");
 *     zafrel_host_session_add_item(session, ZAFREL_HOST_BUNDLE_IDENTIFIER_KEY, "org.example.Recorder");
 *     if (zafrel_host_session_start(session, NULL, &callbacks, my_data) == 0)
 *         zafrel_host_session_run(session);
 *     zafrel_host_session_free(session);
 *
 * Functions that can fail return 0 on success and -1 on failure; zafrel_host_session_error() then
 * says why. The library also logs what goes wrong on standard error, under "zaf.host".
 *
 * Threads: a session is used from one thread at a time. Sessions are independent of each other.
 * The library changes no signal disposition of the program's: it writes with MSG_NOSIGNAL, so a
 * dead extension never raises SIGPIPE.
 *
 * Link with `pkg-config --cflags --libs zafrel-host`.
 */
#ifndef ZAFREL_HOST_H
#define ZAFREL_HOST_H

#include <stddef.h>

#if defined(ZAFREL_HOST_BUILDING)
#define ZAFREL_HOST_API __attribute__((visibility("default")))
#else
#define ZAFREL_HOST_API
#endif

#ifdef __cplusplus
extern "C" {
#endif

/* The host protocol version this library speaks (see the README's protocol section). */
#define ZAFREL_HOST_PROTOCOL_VERSION "1.0"

/* The keys of the items a session hands to the editor. The first three are required. */
#define ZAFREL_HOST_MOVIE_KEY "ZafVideoEditorExtensionMovieURLKey"             /* the movie's path */
#define ZAFREL_HOST_APP_NAME_KEY "ZafVideoEditorExtensionAppNameKey"           /* your program's name */
#define ZAFREL_HOST_BUNDLE_IDENTIFIER_KEY "ZafVideoEditorExtensionBundleIdentifierKey" /* its reverse-DNS id */
#define ZAFREL_HOST_FILE_ATTACHMENT_KEY "ZafVideoEditorExtensionFileAttachmentKey"     /* an extra file to share */
#define ZAFREL_HOST_SHARE_MESSAGE_KEY "ZafVideoEditorExtensionOverrideShareMessageKey" /* the share text */
#define ZAFREL_HOST_TINT_COLOR_KEY "ZafVideoEditorExtensionOverrideTintColorKey"       /* "#RRGGBB" or "#RRGGBBAA" */

/* The activity type of a save to the user's video library, as it appears in a report. */
#define ZAFREL_HOST_ACTIVITY_SAVE "com.zafrel.activity.SaveToPhotoLibrary"

typedef struct zafrel_host_session zafrel_host_session;

/* What a session tells its program. Every member may be NULL. Each is called from
 * zafrel_host_session_dispatch() (or _run()), on the thread that called it; a callback may call
 * zafrel_host_session_remove_view() but must not free the session. Strings are valid only during
 * the call. */
typedef struct zafrel_host_callbacks {
    /* The extension accepted the request and shows the editor; it speaks `protocol_version`. */
    void (*accepted)(void *user_data, const char *protocol_version);
    /* The extension refused the request (a JSON-RPC error `code`, e.g. -32001 for a protocol
     * version it does not speak); it shows no editor. */
    void (*refused)(void *user_data, int code, const char *message);
    /* The user finished: the activity types carried out, in order (count 0: nothing). Answer with
     * zafrel_host_session_remove_view() once you have taken the editor's result in. */
    void (*reported)(void *user_data, const char *const *activity_types, size_t count);
    /* The extension process has ended and been reaped: its exit status, 128 + the signal number
     * when a signal ended it, or -1 when its status was lost. The last callback of a session. */
    void (*finished)(void *user_data, int exit_status);
} zafrel_host_callbacks;

/* A new session, not yet started. NULL only when memory runs out. */
ZAFREL_HOST_API zafrel_host_session *zafrel_host_session_new(void);

/* Ends the extension if it still runs (it takes the end of its channel as the removal of its
 * view, then SIGTERM after a grace period of 3 s, then SIGKILL after another), reaps it and frees
 * the session. Blocks for at most about 6 s; not at all once the session has finished. NULL is
 * allowed. Calls no callback. */
ZAFREL_HOST_API void zafrel_host_session_free(zafrel_host_session *session);

/* Adds an item (before start). `key` is one of the ZAFREL_HOST_*_KEY texts or a key a later
 * version of the protocol added; `value` is UTF-8. A tint that is no "#RRGGBB[AA]" fails. A key
 * given twice keeps the last value. */
ZAFREL_HOST_API int zafrel_host_session_add_item(zafrel_host_session *session, const char *key, const char *value);

/* Starts the extension and sends it the request. `extension_path` NULL: the extension installed
 * beside this library. Fails when a required item is missing, the extension cannot be started or
 * the session was started before. `callbacks` is copied; it and `user_data` may be NULL. */
ZAFREL_HOST_API int zafrel_host_session_start(zafrel_host_session *session, const char *extension_path,
                                              const zafrel_host_callbacks *callbacks, void *user_data);

/* A descriptor that becomes readable when dispatch has work: poll it for input (POLLIN). Valid
 * from start until the session is freed; -1 before start. Do not read it or close it. */
ZAFREL_HOST_API int zafrel_host_session_fd(const zafrel_host_session *session);

/* Does what is ready without waiting: reads the extension's messages, writes what waits to be
 * written, collects the ended process, and calls the callbacks. 1 while the session goes on, 0 once
 * it has finished (the finished callback has run), -1 on an error of the session's own. */
ZAFREL_HOST_API int zafrel_host_session_dispatch(zafrel_host_session *session);

/* Tells the extension to take its view away: it tears the editor down, empties its temporary
 * directory and exits. Fails when the channel is already closed. */
ZAFREL_HOST_API int zafrel_host_session_remove_view(zafrel_host_session *session);

/* Dispatches until the extension has ended, removing its view after the first report. The
 * extension's exit status (as the finished callback has it), or -1 when the session was not
 * started or waiting failed. */
ZAFREL_HOST_API int zafrel_host_session_run(zafrel_host_session *session);

/* The last failure's description, "" when none. Valid until the next call on the session. */
ZAFREL_HOST_API const char *zafrel_host_session_error(const zafrel_host_session *session);

/* The extension installed beside this library (PREFIX/libexec/zafrel/zaf-video-editor-extension),
 * or NULL when it is not there. The string is the library's own. */
ZAFREL_HOST_API const char *zafrel_host_extension_path(void);

#ifdef __cplusplus
}
#endif

#endif /* ZAFREL_HOST_H */
