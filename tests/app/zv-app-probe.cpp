// A small application on the host application framework, for the tests of the framework and
// of what sends it launch requests: it makes a window named like the service's and writes one
// line per lifecycle callback (with the launch request's extras) to $ZV_PROBE_LOG. Extras
// that steer it:
//   PROBE_EXIT       ends the application (ui_app_exit)
//   PROBE_ICONIFY    reports the window iconified, PROBE_RESTORE restored
// $ZV_PROBE_FAIL_CREATE set makes create fail.
#include <Elementary.h>
#include <stdio.h>
#include <stdlib.h>

#include <string>

#include "app.h"

namespace
{

Evas_Object *g_win = nullptr;

void log_line(const std::string &text)
{
    const char *path = getenv("ZV_PROBE_LOG");
    if (FILE *f = path ? fopen(path, "ae") : nullptr) {
        fprintf(f, "%s\n", text.c_str()); // a missing line shows in the test reading the log
        fclose(f);
    }
}

bool on_create(void *)
{
    log_line("create");
    if (getenv("ZV_PROBE_FAIL_CREATE"))
        return false;
    g_win = elm_win_add(nullptr, "zuvo-upload-svc", ELM_WIN_BASIC);
    evas_object_show(g_win);
    return true;
}

void on_app_control(app_control_h app_control, void *)
{
    std::string line = "app_control";
    auto add_extra = [](app_control_h h, const char *key, void *line) {
        char *value = nullptr;
        app_control_get_extra_data(h, key, &value);
        *static_cast<std::string *>(line) += std::string(" ") + key + "=" + (value ? value : "");
        free(value);
        return true;
    };
    app_control_foreach_extra_data(app_control, add_extra, &line);
    log_line(line);
    if (line.find(" PROBE_ICONIFY=") != std::string::npos)
        evas_object_smart_callback_call(g_win, "iconified", nullptr);
    if (line.find(" PROBE_RESTORE=") != std::string::npos)
        evas_object_smart_callback_call(g_win, "normal", nullptr);
    if (line.find(" PROBE_EXIT=") != std::string::npos)
        ui_app_exit();
}

} // namespace

int main(int argc, char **argv)
{
    ui_app_lifecycle_callback_s cb = {on_create, [](void *) { log_line("terminate"); },
                                      [](void *) { log_line("pause"); },
                                      [](void *) { log_line("resume"); }, on_app_control};
    int rc = ui_app_main(argc, argv, &cb, nullptr);
    log_line("exit " + std::to_string(rc));
    return rc == APP_ERROR_NONE || rc == APP_ERROR_ALREADY_RUNNING ? 0 : 1;
}
