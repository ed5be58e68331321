// The Atom entry of a metadata upload from arbitrary field values (NUL-separated in the
// input). The entry must come out for any values; for values that are valid UTF-8, hold no
// character XML forbids and no '&' (entity references are interpreted by design), it must be
// a well-formed document that gives the title back.
#include <glib.h>
#include <libxml/parser.h>
#include <libxml/tree.h>
#include <libxml/xpath.h>
#include <stdint.h>
#include <stdlib.h>
#include <string.h>

#include <algorithm>
#include <sstream>
#include <string>
#include <vector>

#include "zv-plugin-xml.h"

namespace
{

bool plain_text(const std::string &s)
{
    if (!g_utf8_validate(s.data(), static_cast<gssize>(s.size()), nullptr))
        return false;
    for (unsigned char c : s)
        if ((c < 0x20 && c != '\t' && c != '\n') || c == '&' || c == '\r')
            return false;
    return true;
}

// The text of the first element named `name` in the document, "" when there is none.
std::string find_text(xmlDoc *doc, const std::string &name)
{
    xmlXPathContext *context = xmlXPathNewContext(doc);
    const std::string path = "string(//*[local-name()='" + name + "'])";
    xmlXPathObject *text = xmlXPathEvalExpression(BAD_CAST path.c_str(), context);
    std::string found =
        text && text->stringval ? reinterpret_cast<const char *>(text->stringval) : "";
    xmlXPathFreeObject(text);
    xmlXPathFreeContext(context);
    return found;
}

} // namespace

extern "C" int LLVMFuzzerInitialize(int *, char ***)
{
    setenv("ZV_DATA_HOST", "data.example", 1);
    xmlInitParser();
    return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t *data, size_t size)
{
    // Seven fields, each up to the next NUL; those the input lacks are empty.
    std::istringstream input(std::string(reinterpret_cast<const char *>(data), size));
    std::vector<std::string> fields(7);
    for (std::string &field : fields)
        std::getline(input, field, '\0');
    auto arg = [&](size_t i) { return fields[i].empty() ? nullptr : fields[i].c_str(); };
    bool is_private = size > 0 && (data[0] & 1);
    char *doc = zv_plugin_xml_compose_request(arg(0), arg(1), arg(2), arg(3), arg(4), arg(5),
                                              is_private, arg(6));
    if (!doc)
        __builtin_trap(); // an entry is made for any values
    if (std::all_of(fields.begin(), fields.end(), plain_text)) {
        xmlDoc *parsed = xmlReadMemory(doc, static_cast<int>(strlen(doc)), "entry.xml", nullptr,
                                       XML_PARSE_NONET | XML_PARSE_NOERROR | XML_PARSE_NOWARNING);
        if (!parsed)
            __builtin_trap(); // not well-formed
        if (!fields[0].empty() && find_text(parsed, "title") != fields[0])
            __builtin_trap(); // the title did not survive
        xmlFreeDoc(parsed);
    }
    free(doc);
    return 0;
}
