// XML documents of the video service, built and read with libxml2: the Atom entry that a
// metadata upload sends, and the category document with the labels of the categories.
#include "zv-plugin-xml.h"

#include <glib.h>
#include <libxml/parser.h>
#include <libxml/tree.h>
#include <stdlib.h>
#include <string.h>

#include <memory>
#include <string>

#include "zv-log.h"

namespace {

const char ATOM_NS[] = "http://www.w3.org/2005/Atom";
const char MEDIA_NS[] = "http://search.yahoo.com/mrss/";
const char GEORSS_NS[] = "http://www.georss.org/georss";
const char GML_NS[] = "http://www.opengis.net/gml";
const char XML_DECLARATION[] = "<?xml version=\"1.0\"?>\r\n";
const char DEFAULT_DATA_HOST[] = "data.zuvo.example";

struct DocFree {
    void operator()(xmlDoc *doc) const { xmlFreeDoc(doc); }
};
using DocPtr = std::unique_ptr<xmlDoc, DocFree>;

struct BufferFree {
    void operator()(xmlBuffer *buf) const { xmlBufferFree(buf); }
};
using BufferPtr = std::unique_ptr<xmlBuffer, BufferFree>;

const xmlChar *X(const char *text)
{
    return reinterpret_cast<const xmlChar *>(text);
}

// "http://" + the data host + path; the host from ZV_DATA_HOST when it is set.
std::string data_host_address(const char *path)
{
    const char *host = getenv("ZV_DATA_HOST");
    if (!host || !*host)
        host = DEFAULT_DATA_HOST;
    return std::string("http://") + host + path;
}

bool has_name(const xmlNode *node, const char *name)
{
    return node->name && xmlStrcmp(node->name, X(name)) == 0;
}

} // namespace

char *zv_plugin_xml_compose_request(const char *title, const char *description,
                                    const char *category, const char *keywords,
                                    const char *location, const char *permission,
                                    bool is_private, const char *position)
{
    ZV_LOG_ENTER();

    DocPtr doc(xmlNewDoc(X("1.0")));
    if (!doc) {
        ZV_LOGE("Unable to create xml node");
        return nullptr;
    }
    xmlNode *entry = xmlNewDocNode(doc.get(), nullptr, X("entry"), nullptr);
    if (!entry) {
        ZV_LOGE("Unable to create xml node");
        return nullptr;
    }
    xmlDocSetRootElement(doc.get(), entry);

    const std::string zv_ns_uri = data_host_address("/schemas/2007");
    const std::string scheme = data_host_address("/schemas/2007/categories.cat");

    xmlNs *atom_ns = xmlNewNs(entry, X(ATOM_NS), nullptr);
    xmlSetNs(entry, atom_ns);
    xmlNs *media_ns = xmlNewNs(entry, X(MEDIA_NS), X("media"));
    xmlNs *zv_ns = xmlNewNs(entry, X(zv_ns_uri.c_str()), X("zv"));
    xmlNs *georss_ns = nullptr;
    xmlNs *gml_ns = nullptr;
    if (position) {
        georss_ns = xmlNewNs(entry, X(GEORSS_NS), X("georss"));
        gml_ns = xmlNewNs(entry, X(GML_NS), X("gml"));
    }

    xmlNode *group = xmlNewChild(entry, media_ns, X("group"), nullptr);
    if (title) {
        xmlNode *node = xmlNewChild(group, media_ns, X("title"), X(title));
        xmlNewProp(node, X("type"), X("plain"));
    }
    if (description) {
        xmlNode *node = xmlNewChild(group, media_ns, X("description"), X(description));
        xmlNewProp(node, X("type"), X("plain"));
    }
    if (category) {
        xmlNode *node = xmlNewChild(group, media_ns, X("category"), X(category));
        xmlNewProp(node, X("scheme"), X(scheme.c_str()));
    }
    if (keywords)
        xmlNewChild(group, media_ns, X("keywords"), X(keywords));
    if (is_private)
        xmlNewChild(group, zv_ns, X("private"), nullptr);

    if (location)
        xmlNewChild(entry, zv_ns, X("location"), X(location));
    if (permission) {
        xmlNode *node = xmlNewChild(entry, zv_ns, X("accessControl"), nullptr);
        xmlNewProp(node, X("action"), X("list"));
        xmlNewProp(node, X("permission"), X(permission));
    }
    if (position) {
        xmlNode *where = xmlNewChild(entry, georss_ns, X("where"), nullptr);
        xmlNode *point = xmlNewChild(where, gml_ns, X("Point"), nullptr);
        xmlNewChild(point, gml_ns, X("pos"), X(position));
    }

    BufferPtr buf(xmlBufferCreate());
    if (!buf)
        return nullptr;
    xmlNodeDump(buf.get(), doc.get(), entry, 0, 1);
    if (xmlBufferLength(buf.get()) <= 0)
        return nullptr;
    xmlBufferAddHead(buf.get(), X(XML_DECLARATION), -1);

    const size_t len = (size_t)xmlBufferLength(buf.get());
    char *outbuffer = static_cast<char *>(calloc(len + 1, 1));
    g_assert(outbuffer);
    memcpy(outbuffer, xmlBufferContent(buf.get()), len);
    return outbuffer;
}

GList *zv_plugin_xml_get_category_list(const char *language)
{
    ZV_LOG_ENTER();

    const std::string address = data_host_address("/schemas/2007/categories.cat");
    DocPtr doc;
    if (language) {
        char localized[512] = {0};
        snprintf(localized, sizeof localized, "%s?hl=%s", address.c_str(), language);
        ZV_LOGI("%s", localized);
        doc.reset(xmlParseFile(localized));
    }
    if (!doc)
        doc.reset(xmlParseFile(address.c_str()));
    if (!doc) {
        ZV_LOGE("Document parsed failed.\n");
        return nullptr;
    }

    xmlNode *root = xmlDocGetRootElement(doc.get());
    if (!root) {
        ZV_LOGE("empty document\n");
        return nullptr;
    }
    if (!has_name(root, "categories")) {
        ZV_LOGE("root element is null\n");
        return nullptr;
    }

    GList *labels = nullptr;
    for (xmlNode *child = root->children; child; child = child->next) {
        if (child->type != XML_ELEMENT_NODE || !has_name(child, "category"))
            continue;
        for (xmlAttr *attr = child->properties; attr; attr = attr->next) {
            xmlChar *value = xmlNodeGetContent(reinterpret_cast<xmlNode *>(attr));
            if (!value)
                continue;
            if (xmlStrcmp(attr->name, X("label")) == 0) {
                ZV_LOGE("%s", reinterpret_cast<const char *>(value));
                labels = g_list_append(labels, g_strdup(reinterpret_cast<const char *>(value)));
            }
            xmlFree(value);
        }
    }
    return labels;
}
