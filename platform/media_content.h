// Media content database: one row per media file (path, media type, thumbnail path, display
// name) in the SQLite file $ZV_MEDIA_DB (default $XDG_DATA_HOME/zuvo/media.db), looked up
// with filter conditions. A missing or empty database is a lookup that finds nothing.
// Thread safety: every call may run on any thread; each lookup or registration opens its own
// database connection.
#pragma once

#include <stdbool.h>

#ifdef __cplusplus
extern "C" {
#endif

typedef enum {
    MEDIA_CONTENT_ERROR_NONE = 0,
    MEDIA_CONTENT_ERROR_INVALID_PARAMETER = -22,
    MEDIA_CONTENT_ERROR_OUT_OF_MEMORY = -12,
    MEDIA_CONTENT_ERROR_INVALID_OPERATION = -38,
    MEDIA_CONTENT_ERROR_DB_FAILED = -0x01610000 | 0x01,
    MEDIA_CONTENT_ERROR_DB_BUSY = -0x01610000 | 0x02,
} media_content_error_e;

typedef enum {
    MEDIA_CONTENT_TYPE_IMAGE = 0,
    MEDIA_CONTENT_TYPE_VIDEO = 1,
    MEDIA_CONTENT_TYPE_SOUND = 2,
    MEDIA_CONTENT_TYPE_MUSIC = 3,
    MEDIA_CONTENT_TYPE_OTHERS = 4,
} media_content_type_e;

typedef enum {
    MEDIA_CONTENT_COLLATE_DEFAULT = 0,
    MEDIA_CONTENT_COLLATE_NOCASE = 1,
    MEDIA_CONTENT_COLLATE_RTRIM = 2,
} media_content_collation_e;

// Column names a filter condition may compare.
#define MEDIA_PATH "MEDIA_PATH"
#define MEDIA_TYPE "MEDIA_TYPE"
#define MEDIA_DISPLAY_NAME "MEDIA_DISPLAY_NAME"
#define MEDIA_THUMBNAIL_PATH "MEDIA_THUMBNAIL_PATH"

typedef struct media_filter_s *filter_h;
typedef struct media_info_s *media_info_h;

// Called once per matching item, in registration order; return false to stop. The item is
// valid during the call only (clone it to keep it).
typedef bool (*media_info_cb)(media_info_h media, void *user_data);

// Connections are counted: disconnect without a matching connect is DB_FAILED.
int media_content_connect(void);
int media_content_disconnect(void);

int media_filter_create(filter_h *filter);
int media_filter_destroy(filter_h filter);
// condition: terms "COLUMN = VALUE" joined by "and" (any case), VALUE a decimal integer or a
// text in double or single quotes. A quoted text is taken as it stands, without escapes; it
// ends at the last quote after which the rest of the condition still reads as terms, so a
// quote inside a path neither ends the text early nor adds a term. Values are bound as query
// parameters, never pasted into SQL. A condition that does not read as terms is
// INVALID_PARAMETER.
int media_filter_set_condition(filter_h filter, const char *condition,
                               media_content_collation_e collate_type);

// Needs a connection (INVALID_OPERATION without one). A missing media database, or one
// without media rows, calls nothing and returns NONE.
int media_info_foreach_media_from_db(filter_h filter, media_info_cb callback, void *user_data);
int media_info_clone(media_info_h *dst, media_info_h src);
int media_info_destroy(media_info_h media);
// *path / *name: a new text the caller frees (free), or NULL when the item has none.
int media_info_get_thumbnail_path(media_info_h media, char **path);
int media_info_get_display_name(media_info_h media, char **name);
int media_info_get_file_path(media_info_h media, char **path);
int media_info_get_media_type(media_info_h media, media_content_type_e *type);

// Host side, for the companion client: records (or replaces) the row of file_path. The
// database file and its folder are made when missing. thumbnail_path and display_name may be
// NULL (stored as none). No connection is needed.
int media_content_register_file(const char *file_path, media_content_type_e type,
                                const char *thumbnail_path, const char *display_name);

// Host side: makes a PNG thumbnail of one frame of the video at video_path, in the folder
// "thumbs" beside the media database, and returns its path (a new text the caller frees).
// NULL when the host cannot make one (no GStreamer, not a video, a decoder failure, or no
// frame within 2 s): the caller then registers the file without a thumbnail. Blocks while
// the frame is decoded (2 s at most).
char *media_content_create_thumbnail(const char *video_path);

// Called after each thumbnail of a batch, done of total, one call at a time (from any of the
// batch's threads).
typedef void (*media_thumbnail_progress_cb)(int done, int total, void *user_data);

// Host side: media_content_create_thumbnail for count videos, one per core at a time;
// thumbnail_paths[i] receives the answer for video_paths[i]. progress may be NULL. Returns
// once every file has its answer.
int media_content_create_thumbnails(const char *const *video_paths, char **thumbnail_paths,
                                    int count, media_thumbnail_progress_cb progress,
                                    void *user_data);

// Host side: media_content_register_file for count files in one transaction (one commit for
// the lot); thumbnail_paths and display_names may be NULL or hold NULL entries.
int media_content_register_files(const char *const *file_paths, media_content_type_e type,
                                 const char *const *thumbnail_paths,
                                 const char *const *display_names, int count);

#ifdef __cplusplus
}
#endif
