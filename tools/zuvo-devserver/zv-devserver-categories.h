// The documents of the service's data host: the category document in several languages and
// the schema namespace document.
#pragma once

#include <string>

namespace zv_devserver {

// The category document for a language code ("ko", "ko-KR", "ko_KR"; empty: English) with the
// scheme address on host (host[:port]). False when there is no document for that language.
bool category_document(const std::string &language, const std::string &host, std::string *out);

// The document served at the schema namespace address.
std::string schema_document(const std::string &host);

} // namespace zv_devserver
