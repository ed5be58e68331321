// The four extractors of server answers and the media-type lookup on arbitrary text. What an
// extractor returns is cut out of its input, so it must stand in the input as it was.
#include <glib.h>
#include <stdint.h>
#include <string.h>

#include <string>

#include "zv-plugin-util.h"

extern "C" int LLVMFuzzerTestOneInput(const uint8_t *data, size_t size)
{
    const std::string input(reinterpret_cast<const char *>(data), size);
    const std::string text = input.c_str(); // up to the first NUL, as the server text would be
    for (auto extract : {zv_plugin_util_get_token_value, zv_plugin_util_get_location_value,
                         zv_plugin_util_get_video_id_value, zv_plugin_util_get_range_value}) {
        char *buffer = g_strdup(text.c_str()); // cut in place: each gets a fresh copy
        char *value = extract(buffer);
        if (value && text.find(value) == std::string::npos)
            __builtin_trap(); // a value that is not part of the answer
        g_free(value);
        g_free(buffer);
    }
    const char *mime = zv_plugin_util_get_file_mime(text.c_str());
    if (mime && !strchr(mime, '/'))
        __builtin_trap(); // a media type is "type/subtype"
    g_free(zv_plugin_util_get_file_name(text.c_str()));
    return 0;
}
