// Host texts: the text domain "zuvo" bound to the catalogues under <resource path>/locale,
// with English as the fallback of every language the catalogues do not cover.
// Thread safety: bind on the main loop before other threads look texts up.
#include "app_i18n.h"

#include <glib.h>
#include <locale.h>
#include <stdlib.h>
#include <string.h>

#include <atomic>
#include <mutex>
#include <string>

#include "zv-log.h"
#include "zv-platform-util.h"

namespace {

std::once_flag g_locale_ready;

bool is_plain_c(const char *locale)
{
    return !locale || strcmp(locale, "C") == 0 || strcmp(locale, "POSIX") == 0;
}

// gettext translates nothing in the plain C locale and ignores LANGUAGE there, so the
// messages category moves to C.UTF-8 in that case; LANGUAGE then ends in "en" so that a
// language without a catalogue of ours falls back to English rather than to the message id.
void prepare_locale()
{
    const char *messages = setlocale(LC_MESSAGES, "");
    if (is_plain_c(messages) && !setlocale(LC_MESSAGES, "C.UTF-8"))
        ZV_LOGE("no C.UTF-8 locale: texts stay untranslated");
    messages = setlocale(LC_MESSAGES, nullptr);

    const char *language = getenv("LANGUAGE");
    std::string list = language && *language ? language : "";
    if (list.empty() && messages && strncmp(messages, "C.", 2) != 0) {
        // "de_DE.UTF-8@euro" -> "de_DE"
        list = std::string(messages).substr(0, strcspn(messages, ".@"));
    }
    gchar **parts = g_strsplit(list.c_str(), ":", -1);
    bool has_en = false;
    for (gchar **p = parts; *p; p++)
        if (strcmp(*p, "en") == 0)
            has_en = true;
    g_strfreev(parts);
    if (!has_en) {
        list = list.empty() ? "en" : list + ":en";
        setenv("LANGUAGE", list.c_str(), 1);
    }
}

std::atomic<bool> g_domain_bound{false};

} // namespace

void i18n_bind_text_domain(void)
{
    std::call_once(g_locale_ready, prepare_locale);
    std::string dir = zv_platform_resource_dir() + "locale";
    if (!bindtextdomain(ZV_TEXT_DOMAIN, dir.c_str()))
        ZV_LOGE("bindtextdomain %s failed", dir.c_str());
    bind_textdomain_codeset(ZV_TEXT_DOMAIN, "UTF-8");
    g_domain_bound = true;
}

const char *i18n_get_text(const char *msgid)
{
    if (!msgid)
        return nullptr;
    if (!g_domain_bound)
        i18n_bind_text_domain();
    return dgettext(ZV_TEXT_DOMAIN, msgid);
}
