// The Atom entry of a metadata upload, byte for byte, and the category document read from a
// loopback server.
#include <gtest/gtest.h>

#include <map>

#include "zv-plugin-test-server.h"
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

TEST(CategoryListTest, LabelsOfCategoryElementsOnly)
{
    const std::string path = "/schemas/2007/categories.cat";
    const std::string labelled =
        "<?xml version=\"1.0\"?>\n<app:categories xmlns:app=\"http://www.w3.org/2007/app\" "
        "xmlns:atom=\"http://www.w3.org/2005/Atom\">\n"
        "  <atom:category term=\"Film\" label=\"Film\"/>\n"
        "  <!-- a comment -->\n"
        "  <atom:category term=\"Untitled\"/>\n"
        "  <atom:term label=\"Not a category\"/>\n"
        "  <category scheme=\"x\" label=\"Music &amp; Dance\" term=\"Music\"/>\n"
        "  <atom:category label=\"Sports\"/>\n"
        "</app:categories>\n";
    const struct {
        const char *name;
        std::map<std::string, std::string> docs;
        const char *language;
        std::vector<std::string> expected;
    } cases[] = {
        {"document order", {{path, labelled}}, nullptr, {"Film", "Music & Dance", "Sports"}},
        {"language", {{path + "?hl=de", labelled}}, "de", {"Film", "Music & Dance", "Sports"}},
        {"other root", {{path, "<feed><category label=\"Film\"/></feed>"}}, nullptr, {}},
        {"not XML", {{path, "Film, Music"}}, "de", {}},
        {"no document", {}, nullptr, {}},
    };
    for (const auto &c : cases) {
        // Each GET gets the document registered for its target, any other a 404.
        zv_plugin_test::LoopbackServer server([&c](const std::string &request) {
            auto doc = c.docs.find(request.substr(4, request.find(' ', 4) - 4));
            return doc == c.docs.end() ? zv_plugin_test::http_answer("404 Not Found")
                                       : zv_plugin_test::http_answer("200 OK", "", doc->second);
        });
        setenv("ZV_DATA_HOST", server.host().c_str(), 1);
        GList *list = zv_plugin_xml_get_category_list(c.language);
        std::vector<std::string> labels;
        for (GList *l = list; l; l = l->next)
            labels.push_back(static_cast<char *>(l->data));
        g_list_free_full(list, g_free);
        EXPECT_EQ(labels, c.expected) << c.name;
    }
    unsetenv("ZV_DATA_HOST");
}

} // namespace
