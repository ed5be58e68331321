// A main loop whose timer callback allocates a block and forgets it. Run with the project's
// leak suppressions, the address build must report it: a suppression that matched the main
// loop's frames would hide every leak of ours made inside a callback.
#include <Ecore.h>
#include <stdlib.h>

void *volatile zv_leak_probe_block;

extern "C" Eina_Bool zv_leak_probe_timer_cb(void *)
{
    zv_leak_probe_block = malloc(64);
    zv_leak_probe_block = nullptr;
    ecore_main_loop_quit();
    return ECORE_CALLBACK_CANCEL;
}

int main()
{
    ecore_init();
    ecore_timer_add(0.0, zv_leak_probe_timer_cb, nullptr);
    ecore_main_loop_begin();
    ecore_shutdown();
    return 0;
}
