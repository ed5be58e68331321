// A small application on the host application framework for the framework's own tests: it
// makes a window named like the service's and writes one line per lifecycle callback (with
// the launch request's extras) to $ZV_PROBE_LOG. Extras that steer it:
//   PROBE_EXIT       ends the application (ui_app_exit)
//   PROBE_ICONIFY    reports the window iconified, PROBE_RESTORE restored
// $ZV_PROBE_FAIL_CREATE set makes create fail.
#include <Elementary.h>
#include <fcntl.h>
#include <stdlib.h>
#include <string.h>
#include <unistd.h>

#include <string>

#include "app.h"

namespace {

Evas_Object *g_win = nullptr;

void log_line(const std::string &text)
{
    const char *path = getenv("ZV_PROBE_LOG");
    if (!path)
        return;
    int fd = open(path, O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC, 0600);
    if (fd < 0)
        return;
    std::string line = text + "\n";
    if (write(fd, line.data(), line.size()) < 0) {
        // The test reading the log will notice the missing line.
    }
    close(fd);
}

bool on_create(void *)
{
    log_line("create");
    if (getenv("ZV_PROBE_FAIL_CREATE"))
        return false;
    g_win = elm_win_add(nullptr, "zuvo-upload-svc", ELM_WIN_BASIC);
    evas_object_resize(g_win, 360, 640);
    evas_object_show(g_win);
    return true;
}

bool extra_cb(app_control_h app_control, const char *key, void *user_data)
{
    char *value = nullptr;
    app_control_get_extra_data(app_control, key, &value);
    *static_cast<std::string *>(user_data) += std::string(" ") + key + "=" + (value ? value : "");
    free(value);
    return true;
}

void on_app_control(app_control_h app_control, void *)
{
    std::string line = "app_control";
    app_control_foreach_extra_data(app_control, extra_cb, &line);
    log_line(line);
    char *value = nullptr;
    if (app_control_get_extra_data(app_control, "PROBE_ICONIFY", &value) == 0)
        evas_object_smart_callback_call(g_win, "iconified", nullptr);
    free(value);
    value = nullptr;
    if (app_control_get_extra_data(app_control, "PROBE_RESTORE", &value) == 0)
        evas_object_smart_callback_call(g_win, "normal", nullptr);
    free(value);
    value = nullptr;
    if (app_control_get_extra_data(app_control, "PROBE_EXIT", &value) == 0)
        ui_app_exit();
    free(value);
}

void on_pause(void *) { log_line("pause"); }
void on_resume(void *) { log_line("resume"); }
void on_terminate(void *) { log_line("terminate"); }

} // namespace

int main(int argc, char **argv)
{
    ui_app_lifecycle_callback_s cb = {on_create, on_terminate, on_pause, on_resume,
                                      on_app_control};
    int rc = ui_app_main(argc, argv, &cb, nullptr);
    log_line("exit " + std::to_string(rc));
    if (rc == APP_ERROR_ALREADY_RUNNING)
        return 0;
    return rc == APP_ERROR_NONE ? 0 : 1;
}
