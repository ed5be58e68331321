// Texts by message id, in the text domain "zuvo" bound to the catalogues under the
// application's resource folder.
#pragma once

#include <libintl.h>

#ifdef __cplusplus
extern "C" {
#endif

#define ZV_TEXT_DOMAIN "zuvo"

// Binds the text domain to <resource path>/locale once; called by the application framework
// before create, and safe to call again.
void i18n_bind_text_domain(void);
// The translation of msgid in the "zuvo" domain (msgid itself when none); never freed.
const char *i18n_get_text(const char *msgid);

#ifdef __cplusplus
}
#endif
