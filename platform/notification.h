// Notification service: a posted notification is the GLib key file
// $ZV_RUNTIME_DIR/notifications/TAG.ini (group "notification"), written, rewritten, read and
// removed by tag, so that any process can find it again. Status messages are appended to
// notifications/status-messages.log. When a desktop notification service is on the session
// bus, posted notifications are shown there too (best effort, never an error).
// Thread safety: main loop only.
#pragma once

#include <stdbool.h>
#include <time.h>

#ifdef __cplusplus
extern "C" {
#endif

typedef struct _notification *notification_h;

typedef enum {
    NOTIFICATION_ERROR_NONE = 0,
    NOTIFICATION_ERROR_INVALID_PARAMETER = -22,
    NOTIFICATION_ERROR_OUT_OF_MEMORY = -12,
    NOTIFICATION_ERROR_IO_ERROR = -5,
    NOTIFICATION_ERROR_PERMISSION_DENIED = -13,
    NOTIFICATION_ERROR_FROM_DB = -0x01140000 | 0x01,
    NOTIFICATION_ERROR_ALREADY_EXIST_ID = -0x01140000 | 0x02,
    NOTIFICATION_ERROR_FROM_DBUS = -0x01140000 | 0x03,
    NOTIFICATION_ERROR_NOT_EXIST_ID = -0x01140000 | 0x04,
    NOTIFICATION_ERROR_SERVICE_NOT_READY = -0x01140000 | 0x05,
} notification_error_e;

typedef enum {
    NOTIFICATION_TYPE_NONE = -1,
    NOTIFICATION_TYPE_NOTI = 0,
    NOTIFICATION_TYPE_ONGOING = 1,
} notification_type_e;

typedef enum {
    NOTIFICATION_TEXT_TYPE_NONE = -1,
    NOTIFICATION_TEXT_TYPE_TITLE = 0,
    NOTIFICATION_TEXT_TYPE_CONTENT = 1,
    NOTIFICATION_TEXT_TYPE_CONTENT_FOR_DISPLAY_OPTION_IS_OFF = 2,
    NOTIFICATION_TEXT_TYPE_EVENT_COUNT = 3,
} notification_text_type_e;

typedef enum {
    NOTIFICATION_VARIABLE_TYPE_NONE = -1,
    NOTIFICATION_VARIABLE_TYPE_INT = 0,
    NOTIFICATION_VARIABLE_TYPE_DOUBLE = 1,
    NOTIFICATION_VARIABLE_TYPE_STRING = 2,
    NOTIFICATION_VARIABLE_TYPE_COUNT = 3,
} notification_variable_type_e;

enum {
    NOTIFICATION_DISPLAY_APP_NOTIFICATION_TRAY = 0x00000001,
    NOTIFICATION_DISPLAY_APP_TICKER = 0x00000002,
    NOTIFICATION_DISPLAY_APP_LOCK = 0x00000004,
    NOTIFICATION_DISPLAY_APP_INDICATOR = 0x00000008,
    NOTIFICATION_DISPLAY_APP_ALL = 0x0000000f,
};

enum {
    NOTIFICATION_PROP_DISPLAY_ONLY_SIMMODE = 0x00000001,
    NOTIFICATION_PROP_DISABLE_APP_LAUNCH = 0x00000002,
};

typedef enum {
    NOTIFICATION_LAUNCH_OPTION_APP_CONTROL = 1,
} notification_launch_option_type;

// A new, unposted notification, or NULL for a type other than NOTI and ONGOING.
notification_h notification_create(notification_type_e type);
// The notification posted under tag, read from its tray file; NULL when there is none or the
// file cannot be read as a notification (then logged). The caller frees it.
notification_h notification_load_by_tag(const char *tag);
int notification_free(notification_h noti);

// text may be NULL (clears it). key and the variable arguments are accepted for the call's
// shape; the arguments must end at once with NOTIFICATION_VARIABLE_TYPE_NONE.
int notification_set_text(notification_h noti, notification_text_type_e type, const char *text,
                          const char *key, int args_type, ...);
// *text: the handle's own text (valid while the handle lives), or NULL.
int notification_get_text(notification_h noti, notification_text_type_e type, char **text);
// A fraction from 0.0 to 1.0.
int notification_set_progress(notification_h noti, double percentage);
int notification_get_progress(notification_h noti, double *percentage);
int notification_set_display_applist(notification_h noti, int applist);
int notification_get_display_applist(notification_h noti, int *applist);
// A tag names the tray file: it must be non-empty, without '/', and not "." or "..".
int notification_set_tag(notification_h noti, const char *tag);
// *tag: the handle's own text, or NULL.
int notification_get_tag(notification_h noti, const char **tag);
int notification_set_property(notification_h noti, int flags);
int notification_get_property(notification_h noti, int *flags);
// 0 stamps the current time.
int notification_set_time(notification_h noti, time_t input_time);
int notification_get_time(notification_h noti, time_t *ret_time);
// option: an app_control_h; the notification keeps the app id it names.
int notification_set_launch_option(notification_h noti, notification_launch_option_type type,
                                   void *option);
int notification_get_type(notification_h noti, notification_type_e *type);

// Writes the tray file (a notification without a tag gets a unique one). Replaces a
// notification posted earlier under the same tag.
int notification_post(notification_h noti);
// Rewrites the tray file of the handle's tag; NOT_EXIST_ID when none is posted under it.
int notification_update(notification_h noti);
// Removes the tray file of the handle's tag; NOT_EXIST_ID when none is posted under it.
int notification_delete(notification_h noti);

// Appends message as one line to the status message log.
int notification_status_message_post(const char *message);

// Host side: the tray folder, $ZV_RUNTIME_DIR/notifications (a new text the caller frees),
// or NULL without a usable runtime folder.
char *notification_tray_dir(void);

#ifdef __cplusplus
}
#endif
