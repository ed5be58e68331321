// The Atom entry of a metadata upload for values the client never sends; the client tests
// check its entries byte for byte on the wire.
#include <gtest/gtest.h>

#include <string>

#include "zv-plugin-xml.h"

namespace
{

TEST(ComposeTest, ContentIsEscapedAndAbsentPartsAreLeftOut)
{
    setenv("ZV_DATA_HOST", "data.test:81", 1);
    const std::string open =
        "<?xml version=\"1.0\"?>\r\n<entry xmlns=\"http://www.w3.org/2005/Atom\""
        " xmlns:media=\"http://search.yahoo.com/mrss/\""
        " xmlns:zv=\"http://data.test:81/schemas/2007\">\n";
    // Entity references in content are interpreted, markup characters escaped on output.
    char *doc = zv_plugin_xml_compose_request("Tom &amp; Jerry <3", nullptr, nullptr, "a&lt;b",
                                              nullptr, nullptr, false, nullptr);
    EXPECT_EQ(doc ? doc : "(null)",
              open + "  <media:group>\n"
                     "    <media:title type=\"plain\">Tom &amp; Jerry &lt;3</media:title>\n"
                     "    <media:keywords>a&lt;b</media:keywords>\n"
                     "  </media:group>\n</entry>");
    free(doc);
    doc = zv_plugin_xml_compose_request(nullptr, nullptr, nullptr, nullptr, nullptr, nullptr, false,
                                        nullptr);
    EXPECT_EQ(doc ? doc : "(null)", open + "  <media:group/>\n</entry>");
    free(doc);
    unsetenv("ZV_DATA_HOST");
}

} // namespace
