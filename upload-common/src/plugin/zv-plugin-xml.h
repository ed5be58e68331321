// XML documents of the video service: the Atom entry of a metadata upload and the category
// document. Both use the service's data host (env ZV_DATA_HOST, "host[:port]").
#pragma once

#include <glib.h>

// The Atom entry of a metadata upload: a new text (release with free()) holding the
// declaration line and the serialised entry element, or NULL. Every argument may be NULL:
// an absent part is left out. `permission` is the list permission of the access control,
// `is_private` adds the private marker, `position` ("lat lon") adds the GeoRSS point. Texts
// go in as element content, where entity references are interpreted.
char *zv_plugin_xml_compose_request(const char *title, const char *description,
                                    const char *category, const char *keywords,
                                    const char *location, const char *permission,
                                    bool is_private, const char *position);

// Fetches and reads the category document (for `language`, falling back to the document
// without language) on the calling thread. A new list of new texts (release with
// g_list_free_full(list, g_free)): the category labels in document order, or NULL.
GList *zv_plugin_xml_get_category_list(const char *language);

