// Application framework: the UI application loop with its lifecycle callbacks, launch
// requests (app controls) with string extras, resource paths and preinitialized objects.
// Thread safety: main loop only.
#pragma once

#include <Evas.h>
#include <stdbool.h>
#include <stddef.h>

#ifdef __cplusplus
extern "C" {
#endif

typedef struct app_control_s *app_control_h;

typedef enum {
    APP_ERROR_NONE = 0,
    APP_ERROR_INVALID_PARAMETER = -22,
    APP_ERROR_OUT_OF_MEMORY = -12,
    APP_ERROR_INVALID_CONTEXT = -1,
    APP_ERROR_ALREADY_RUNNING = -114,
} app_error_e;

typedef enum {
    APP_CONTROL_ERROR_NONE = 0,
    APP_CONTROL_ERROR_INVALID_PARAMETER = -22,
    APP_CONTROL_ERROR_OUT_OF_MEMORY = -12,
    APP_CONTROL_ERROR_KEY_NOT_FOUND = -126,
    APP_CONTROL_ERROR_INVALID_DATA_TYPE = -0x01110000 | 0x21,
    // The application of the app id cannot be found (no executable to start).
    APP_CONTROL_ERROR_APP_NOT_FOUND = -0x01110000 | 0x22,
    // The running instance did not take the request, or it could not be started.
    APP_CONTROL_ERROR_LAUNCH_REJECTED = -0x01110000 | 0x23,
} app_control_error_e;

typedef bool (*app_create_cb)(void *user_data);
typedef void (*app_terminate_cb)(void *user_data);
typedef void (*app_pause_cb)(void *user_data);
typedef void (*app_resume_cb)(void *user_data);
typedef void (*app_control_cb)(app_control_h app_control, void *user_data);

typedef struct {
    app_create_cb create;
    app_terminate_cb terminate;
    app_pause_cb pause;
    app_resume_cb resume;
    app_control_cb app_control;
} ui_app_lifecycle_callback_s;

// Runs the application: parses "--extra KEY=VALUE" arguments into the first launch request,
// becomes the running instance (or hands the request to the running one and returns
// APP_ERROR_ALREADY_RUNNING after it was taken), calls create, delivers launch requests,
// and returns APP_ERROR_NONE once the loop has ended and terminate has run.
// "--help" prints the usage and exits 0; a wrong command line prints one line on standard
// error and exits 2, both before anything else happens. A create that returns false ends it
// with APP_ERROR_INVALID_CONTEXT (terminate is not called); so does a failure to become the
// instance. SIGTERM and SIGINT end the loop like ui_app_exit.
int ui_app_main(int argc, char **argv, ui_app_lifecycle_callback_s *callback, void *user_data);
// Ends the main loop; terminate runs after it.
void ui_app_exit(void);

int app_control_create(app_control_h *app_control);
int app_control_destroy(app_control_h app_control);
int app_control_set_app_id(app_control_h app_control, const char *app_id);
int app_control_get_app_id(app_control_h app_control, char **app_id);
int app_control_add_extra_data(app_control_h app_control, const char *key, const char *value);
// On success *value is a copy the caller frees; an absent key is
// APP_CONTROL_ERROR_KEY_NOT_FOUND with *value left NULL.
int app_control_get_extra_data(app_control_h app_control, const char *key, char **value);
// Calls cb for every extra in insertion order until it returns false.
typedef bool (*app_control_extra_data_cb)(app_control_h app_control, const char *key,
                                          void *user_data);
int app_control_foreach_extra_data(app_control_h app_control, app_control_extra_data_cb cb,
                                   void *user_data);
// Sends a launch request to the application of its app id (this host: the service's
// instance socket, starting the service when none runs). The app id must be unset or
// "zuvo-upload-svc" (else APP_CONTROL_ERROR_APP_NOT_FOUND). Returns once the running instance
// has taken the request, or once the started service process has been executed; reply_cb is
// never called on this host. Keys must not contain '=' (they travel as "--extra KEY=VALUE").
int app_control_send_launch_request(app_control_h app_control, void *reply_cb, void *user_data);

// Allocated paths ending in '/', or NULL.
char *app_get_resource_path(void);
char *app_get_shared_resource_path(void);
char *app_get_data_path(void);
int app_get_id(char **id);

// Objects the platform may have made before the process started; NULL on this host.
Evas_Object *app_get_preinitialized_window(const char *win_name);
Evas_Object *app_get_preinitialized_background(void);
Evas_Object *app_get_preinitialized_conformant(void);

// ---- Host additions (not part of the phone platform's interface) ----

// The folder for volatile state: $ZV_RUNTIME_DIR, else $XDG_RUNTIME_DIR/zuvo, else
// /tmp/zuvo-$UID; made with mode 0700 when missing, refused (NULL) when it is not a folder
// owned by this user. Allocated (g_free), without a trailing '/'. Any thread.
char *zv_platform_runtime_dir(void);

// Launch messages on the instance socket. A message is
//   "ZVL1"  u32 payload length N  |  payload: u32 count, count x (u32 key length, key bytes,
//                                     u32 value length, value bytes)
// all integers little-endian, keys non-empty, keys and values UTF-8 without NUL bytes,
// at most ZV_APP_LAUNCH_MAX_EXTRAS extras and ZV_APP_LAUNCH_MAX_MESSAGE bytes in all.
// The instance answers one byte: 'A' (taken) or 'R' (refused).
#define ZV_APP_LAUNCH_MAGIC "ZVL1"
#define ZV_APP_LAUNCH_HEADER_SIZE 8
#define ZV_APP_LAUNCH_MAX_MESSAGE (64 * 1024)
#define ZV_APP_LAUNCH_MAX_EXTRAS 256

// Encodes the extras of app_control; a g_malloc'ed message and its size in *size, or NULL
// when it would break the limits above.
unsigned char *zv_app_launch_message_encode(app_control_h app_control, size_t *size);
// Parses one whole message (header included) into a new app control in *app_control.
// APP_CONTROL_ERROR_NONE, or APP_CONTROL_ERROR_INVALID_DATA_TYPE for a malformed message
// (*app_control then stays NULL). Takes any bytes: the socket's input is untrusted.
int zv_app_launch_message_parse(const unsigned char *data, size_t size,
                                app_control_h *app_control);

#ifdef __cplusplus
}
#endif
