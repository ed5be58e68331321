// Texts: every message id of the English catalogue is translated in the "zuvo" domain, both
// through i18n_get_text and through dcgettext; an unknown id shows as itself; the count
// formats take one int.
#include "app_i18n.h"

#include <gtest/gtest.h>
#include <libintl.h>

#include <regex>
#include <string>

#include "zv-test-util.h"

TEST(I18n, EveryIdHasItsEnglishText)
{
    i18n_bind_text_domain();
    // The msgid/msgstr pairs of the catalogue (single-line entries, as ours are).
    std::string po = zv_test::read_file(zv_test::source_path("res/po/en.po"));
    std::regex entry("msgid \"(IDS_[A-Z0-9_]+)\"\\nmsgstr \"([^\"]+)\"");
    int ids = 0;
    for (std::sregex_iterator it(po.begin(), po.end(), entry), end; it != end; ++it, ++ids) {
        EXPECT_EQ(i18n_get_text((*it)[1].str().c_str()), (*it)[2].str());
        EXPECT_EQ(dcgettext(ZV_TEXT_DOMAIN, (*it)[1].str().c_str(), LC_MESSAGES), (*it)[2].str());
    }
    EXPECT_GE(ids, 17);
    EXPECT_STREQ(i18n_get_text("IDS_GALLERY_HEADER_UPLOADS"), "Uploads");
    EXPECT_STREQ(i18n_get_text("IDS_NOT_IN_THE_CATALOGUE"), "IDS_NOT_IN_THE_CATALOGUE");
    EXPECT_STREQ(i18n_get_text("IDS_MF_BODY_PD_FILES"), "%d files");
    EXPECT_STREQ(i18n_get_text("IDS_VIDEO_HEADER_PD_SELECTED"), "%d selected");
}
