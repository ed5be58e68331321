// Plugin utilities: stateless helpers of the service client. Media type, file name and
// size of a file, a time-based id, and four extractors that cut one value out of the
// header or body text of a server answer. Callable from any thread.
//
// The extractors cut the text they are given in place (they write NUL bytes into it), so
// hand them a text nobody reads afterwards. Header names are matched with exact case.
// Every returned char* is a fresh copy: release it with g_free (or free).
#pragma once

#include <stdint.h>

// The media type of the path's last extension ("video/mp4" for "clip.MP4"), or NULL for an
// unknown extension, no "." or a NULL path. Static text: never freed.
const char *zv_plugin_util_get_file_mime(const char *file_path);
// The text after the last "/" (the whole path without one; "" for a path ending in "/"),
// or NULL for a NULL path.
char *zv_plugin_util_get_file_name(const char *path);
// The file's size in bytes, or -1 when it cannot be read. 64-bit: videos pass 2 GiB.
int64_t zv_plugin_util_get_file_size(const char *path);
// The current time in whole seconds since the epoch.
int zv_plugin_util_generate_id(void);

// The first quoted JSON string value after ": \"" of a token answer body, or NULL (also when
// the body holds the text "error").
char *zv_plugin_util_get_token_value(char *buffer);
// The value of the first "Location:" header, one leading white-space character dropped.
char *zv_plugin_util_get_location_value(char *buffer);
// The value of the first "ETag:" header as it stands (normally a space and the quoted tag).
char *zv_plugin_util_get_video_id_value(char *buffer);
// The upper bound of the first "Range: bytes=" header as decimal text ("1023" for
// "Range: bytes=0-1023"), not validated.
char *zv_plugin_util_get_range_value(char *buffer);
