// Launch messages as the instance socket receives them: any bytes. A message that parses
// must encode again to a message that parses to the same extras.
#include <app.h>
#include <glib.h>
#include <stdint.h>
#include <string.h>

#include <map>
#include <string>

namespace
{

// Keeps an extra of the request with its value ("" when it has none).
bool collect(app_control_h request, const char *key, void *user_data)
{
    char *value = nullptr;
    app_control_get_extra_data(request, key, &value);
    (*static_cast<std::map<std::string, std::string> *>(user_data))[key] = value ? value : "";
    free(value);
    return true;
}

std::map<std::string, std::string> extras_of(app_control_h request)
{
    std::map<std::string, std::string> extras;
    app_control_foreach_extra_data(request, collect, &extras);
    return extras;
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t *data, size_t size)
{
    app_control_h request = nullptr;
    if (zv_app_launch_message_parse(data, size, &request) != APP_CONTROL_ERROR_NONE) {
        if (request)
            __builtin_trap(); // a refused message leaves no request behind
        return 0;
    }
    size_t again_size = 0;
    unsigned char *again = zv_app_launch_message_encode(request, &again_size);
    if (!again)
        __builtin_trap(); // what was taken in can be sent on
    app_control_h reparsed = nullptr;
    if (zv_app_launch_message_parse(again, again_size, &reparsed) != APP_CONTROL_ERROR_NONE ||
        extras_of(reparsed) != extras_of(request))
        __builtin_trap();
    app_control_destroy(reparsed);
    app_control_destroy(request);
    g_free(again);
    return 0;
}
