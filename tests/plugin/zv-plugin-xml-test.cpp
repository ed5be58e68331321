// The Atom entry of a metadata upload, byte for byte.
#include <gtest/gtest.h>

#include "zv-plugin-xml.h"

namespace {

const std::string DECL = "<?xml version=\"1.0\"?>\r\n";
const std::string OPEN = "<entry xmlns=\"http://www.w3.org/2005/Atom\""
                         " xmlns:media=\"http://search.yahoo.com/mrss/\""
                         " xmlns:zv=\"http://data.test:81/schemas/2007\"";
const std::string GEO_NS = " xmlns:georss=\"http://www.georss.org/georss\""
                           " xmlns:gml=\"http://www.opengis.net/gml\"";
const std::string SCHEME = "http://data.test:81/schemas/2007/categories.cat";

TEST(ComposeTest, DocumentsByteForByte)
{
    setenv("ZV_DATA_HOST", "data.test:81", 1);
    const struct {
        const char *name;
        const char *title, *description, *category, *keywords, *location, *permission;
        bool is_private;
        const char *position;
        std::string expected;
    } cases[] = {
        // Everything present: namespaces in order, children in document order.
        {"all parts", "Clip", "At the beach", "People", "sea, sand", "Busan", "denied", true,
         "37.500000 127.000000",
         DECL + OPEN + GEO_NS + ">\n"
                "  <media:group>\n"
                "    <media:title type=\"plain\">Clip</media:title>\n"
                "    <media:description type=\"plain\">At the beach</media:description>\n"
                "    <media:category scheme=\"" + SCHEME + "\">People</media:category>\n"
                "    <media:keywords>sea, sand</media:keywords>\n"
                "    <zv:private/>\n"
                "  </media:group>\n"
                "  <zv:location>Busan</zv:location>\n"
                "  <zv:accessControl action=\"list\" permission=\"denied\"/>\n"
                "  <georss:where>\n"
                "    <gml:Point>\n"
                "      <gml:pos>37.500000 127.000000</gml:pos>\n"
                "    </gml:Point>\n"
                "  </georss:where>\n"
                "</entry>"},
        // The controller's usual entry: no description, tags, location or position.
        {"minimal public", "Clip", nullptr, "Film", nullptr, nullptr, "allowed", false, nullptr,
         DECL + OPEN + ">\n"
                "  <media:group>\n"
                "    <media:title type=\"plain\">Clip</media:title>\n"
                "    <media:category scheme=\"" + SCHEME + "\">Film</media:category>\n"
                "  </media:group>\n"
                "  <zv:accessControl action=\"list\" permission=\"allowed\"/>\n"
                "</entry>"},
        // No permission and no marker (privacy outside 0-2), position only.
        {"position without access control", "Clip", nullptr, "Film", nullptr, nullptr, nullptr,
         false, "-33.868800 151.209300",
         DECL + OPEN + GEO_NS + ">\n"
                "  <media:group>\n"
                "    <media:title type=\"plain\">Clip</media:title>\n"
                "    <media:category scheme=\"" + SCHEME + "\">Film</media:category>\n"
                "  </media:group>\n"
                "  <georss:where>\n"
                "    <gml:Point>\n"
                "      <gml:pos>-33.868800 151.209300</gml:pos>\n"
                "    </gml:Point>\n"
                "  </georss:where>\n"
                "</entry>"},
        // Entity references in content are interpreted, markup characters escaped on output.
        {"content escaping", "Tom &amp; Jerry <3", nullptr, nullptr, "a&lt;b", nullptr, nullptr,
         false, nullptr,
         DECL + OPEN + ">\n"
                "  <media:group>\n"
                "    <media:title type=\"plain\">Tom &amp; Jerry &lt;3</media:title>\n"
                "    <media:keywords>a&lt;b</media:keywords>\n"
                "  </media:group>\n"
                "</entry>"},
        {"nothing given", nullptr, nullptr, nullptr, nullptr, nullptr, nullptr, false, nullptr,
         DECL + OPEN + ">\n  <media:group/>\n</entry>"},
    };
    for (const auto &c : cases) {
        char *doc = zv_plugin_xml_compose_request(c.title, c.description, c.category, c.keywords,
                                                  c.location, c.permission, c.is_private,
                                                  c.position);
        EXPECT_EQ(doc ? doc : "(null)", c.expected) << c.name;
        free(doc);
    }
    unsetenv("ZV_DATA_HOST");
}

} // namespace
