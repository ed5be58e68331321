// Texts: every message id of the English catalogue is translated in the "zuvo" domain, both
// through i18n_get_text and through dcgettext, and the count formats take one int.
#include "app_i18n.h"

#include <gtest/gtest.h>
#include <libintl.h>
#include <locale.h>

#include <algorithm>
#include <regex>
#include <string>
#include <utility>
#include <vector>

#include "zv-test-util.h"

using namespace zv_test;

namespace {

// The msgid/msgstr pairs of a catalogue (single-line entries, as ours are).
std::vector<std::pair<std::string, std::string>> catalogue(const std::string &path)
{
    std::vector<std::pair<std::string, std::string>> pairs;
    std::string text = read_file(path);
    std::regex entry("msgid \"(IDS_[A-Z0-9_]+)\"\\nmsgstr \"([^\"]+)\"");
    for (std::sregex_iterator it(text.begin(), text.end(), entry), end; it != end; ++it)
        pairs.emplace_back((*it)[1], (*it)[2]);
    return pairs;
}

} // namespace

TEST(I18n, EveryIdHasItsEnglishText)
{
    i18n_bind_text_domain();
    std::string source_dir = std::string(__FILE__).substr(0, std::string(__FILE__).rfind('/'));
    auto pairs = catalogue(source_dir + "/../../res/po/en.po");
    ASSERT_GE(pairs.size(), 17u);
    for (const auto &p : pairs) {
        EXPECT_EQ(i18n_get_text(p.first.c_str()), p.second) << p.first;
        EXPECT_STREQ(dcgettext(ZV_TEXT_DOMAIN, p.first.c_str(), LC_MESSAGES), p.second.c_str());
    }
    EXPECT_STREQ(i18n_get_text("IDS_GALLERY_HEADER_UPLOADS"), "Uploads");
    EXPECT_STREQ(i18n_get_text("IDS_NOT_IN_THE_CATALOGUE"), "IDS_NOT_IN_THE_CATALOGUE");
}

TEST(I18n, CountFormatsTakeExactlyOneInt)
{
    for (const char *id : {"IDS_MF_BODY_PD_FILES", "IDS_VIDEO_HEADER_PD_SELECTED"}) {
        std::string text = i18n_get_text(id);
        EXPECT_EQ(std::count(text.begin(), text.end(), '%'), 1) << text;
        EXPECT_NE(text.find("%d"), std::string::npos) << text;
    }
}
