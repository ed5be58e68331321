// Plugin utilities: media types, file names and sizes, time-based ids, and the extractors
// that cut the service's values out of answer texts.
#include "zv-plugin-util.h"

#include <glib.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <time.h>

#include <memory>

#include "zv-log.h"

namespace
{

constexpr size_t kPathBufferSize = 4096;

struct MimeRow {
    const char *ext;
    const char *type;
};

// Compared in order; the first equal row wins.
constexpr MimeRow kMimeTable[] = {
    {".jpeg", "image/jpeg"},     {".jpg", "image/jpeg"},      {".png", "image/png"},
    {".bmp", "image/bmp"},       {".gif", "image/gif"},       {".tiff", "image/tiff"},
    {".mp4", "video/mp4"},       {".wmv", "video/x-ms-wmv"},  {".mp3", "audio/mp3"},
    {".3gp", "video/3gp"},       {".avi", "video/x-msvideo"}, {".doc", "application/msword"},
    {".pdf", "application/pdf"}, {".zip", "application/zip"}, {".txt", "text/plain"},
};

struct FileCloser {
    void operator()(FILE *f) const { fclose(f); }
};

// Skips leading CR and LF, then cuts the run that follows at the next CR, LF or the end of
// the text (writing a NUL there). NULL when nothing but line ends is left.
char *first_line_piece(char *text)
{
    text += strspn(text, "\r\n");
    if (*text == '\0')
        return NULL;
    char *end = text + strcspn(text, "\r\n");
    *end = '\0';
    return text;
}

// The piece after the colon of the first header named by `name` (which ends in ':'),
// cut in place; NULL when the header or its value is missing.
char *header_value(char *buffer, const char *name)
{
    char *found = strstr(buffer, name);
    if (!found)
        return NULL;
    char *colon = found + strlen(name) - 1;
    *colon = '\0';
    return first_line_piece(colon + 1);
}

} // namespace

const char *zv_plugin_util_get_file_mime(const char *file_path)
{
    ZV_LOG_ENTER();
    if (!file_path) {
        ZV_LOGE("file name is NULL");
        return NULL;
    }

    char path[kPathBufferSize];
    g_strlcpy(path, file_path, sizeof(path));

    const char *dot = strrchr(path, '.');
    if (!dot)
        return NULL;

    std::unique_ptr<char, decltype(&g_free)> pExt(
        static_cast<char *>(g_try_malloc(strlen(path) + 1)), &g_free);
    g_assert(pExt);
    char *ext = pExt.get();
    strcpy(ext, dot);
    for (char *c = ext; *c; ++c) {
        if (*c >= 'A' && *c <= 'Z')
            *c = static_cast<char>(*c - 'A' + 'a');
    }

    for (const MimeRow &row : kMimeTable) {
        if (strcmp(ext, row.ext) == 0)
            return row.type;
    }
    return NULL;
}

char *zv_plugin_util_get_file_name(const char *path)
{
    ZV_LOG_ENTER();
    if (!path) {
        ZV_LOGE("path name is NULL");
        return NULL;
    }
    const char *slash = strrchr(path, '/');
    const char *name = path;
    if (slash) {
        name = slash + 1;
        ZV_LOGI("%s", name);
    }
    return g_strdup(name);
}

int64_t zv_plugin_util_get_file_size(const char *path)
{
    ZV_LOG_ENTER();
    if (!path) {
        ZV_LOGE("path name is NULL");
        return -1;
    }
    std::unique_ptr<FILE, FileCloser> file(fopen(path, "rb"));
    if (!file) {
        ZV_LOGE("Unable to open file");
        return -1;
    }
    if (fseeko(file.get(), 0, SEEK_END) != 0)
        return -1;
    off_t size = ftello(file.get());
    if (size == -1) {
        ZV_LOGE("ERROR: ftell in zuvo \n");
        return -1;
    }
    return static_cast<int64_t>(size);
}

int zv_plugin_util_generate_id(void)
{
    ZV_LOG_ENTER();
    time_t now = time(NULL);
    struct tm local;
    if (!localtime_r(&now, &local))
        return static_cast<int>(now);
    return static_cast<int>(mktime(&local));
}

char *zv_plugin_util_get_token_value(char *buffer)
{
    ZV_LOG_ENTER();
    if (!buffer) {
        ZV_LOGE("buffer is NULL");
        return NULL;
    }
    if (strstr(buffer, "error")) {
        if (strstr(buffer, "\"invalid_grant\""))
            ZV_LOGI("invalid_grant");
        else
            ZV_LOGI("bad request");
        return NULL;
    }
    char *start = strstr(buffer, ": \"");
    if (!start) {
        ZV_LOGI("bad request");
        return NULL;
    }
    start += 3;
    start += strspn(start, "\"");
    if (*start == '\0')
        return NULL;
    char *end = strchr(start, '"');
    if (end)
        *end = '\0';
    return g_strdup(start);
}

char *zv_plugin_util_get_location_value(char *buffer)
{
    ZV_LOG_ENTER();
    if (!buffer) {
        ZV_LOGE("buffer is NULL");
        return NULL;
    }
    char *value = header_value(buffer, "Location:");
    if (!value)
        return NULL;
    if (g_ascii_isspace(*value))
        ++value;
    return g_strdup(value);
}

char *zv_plugin_util_get_video_id_value(char *buffer)
{
    ZV_LOG_ENTER();
    if (!buffer) {
        ZV_LOGE("buffer is NULL");
        return NULL;
    }
    char *value = header_value(buffer, "ETag:");
    return value ? g_strdup(value) : NULL;
}

char *zv_plugin_util_get_range_value(char *buffer)
{
    ZV_LOG_ENTER();
    if (!buffer) {
        ZV_LOGE("buffer is NULL");
        return NULL;
    }
    char *found = strstr(buffer, "Range: bytes=");
    if (!found)
        return NULL;
    // The dash is looked for past the header's own line too.
    char *dash = strchr(found, '-');
    if (!dash)
        return NULL;
    *dash = '\0';
    char *value = first_line_piece(dash + 1);
    return value ? g_strdup(value) : NULL;
}
