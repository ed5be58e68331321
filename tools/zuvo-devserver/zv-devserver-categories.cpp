// Category and schema documents of the development server's data host.
#include "zv-devserver-categories.h"

#include <cctype>
#include <cstddef>

namespace zv_devserver {

namespace {

constexpr size_t kCategoryCount = 15;

const char *const kTerms[kCategoryCount] = {
    "Film", "Autos", "Music", "Animals", "Sports", "Travel", "Games", "People",
    "Comedy", "Entertainment", "News", "Howto", "Education", "Tech", "Nonprofit",
};

struct Language {
    const char *code;    // the language part of a code, lower case
    const char *xml_lang;
    const char *labels[kCategoryCount];
};

const Language kLanguages[] = {
    {"en", "en-US",
     {"Film & Animation", "Autos & Vehicles", "Music", "Pets & Animals", "Sports", "Travel & Events",
      "Gaming", "People & Blogs", "Comedy", "Entertainment", "News & Politics", "Howto & Style",
      "Education", "Science & Technology", "Nonprofits & Activism"}},
    {"ko", "ko-KR",
     {"영화 및 애니메이션", "자동차 및 차량", "음악", "애완동물 및 동물", "스포츠", "여행 및 이벤트",
      "게임", "인물 및 블로그", "코미디", "엔터테인먼트", "뉴스 및 정치", "노하우 및 스타일", "교육",
      "과학 및 기술", "비영리 및 사회 운동"}},
    {"de", "de-DE",
     {"Film & Animation", "Autos & Fahrzeuge", "Musik", "Haustiere & Tiere", "Sport", "Reisen & Events",
      "Gaming", "Menschen & Blogs", "Comedy", "Unterhaltung", "Nachrichten & Politik",
      "Praktische Tipps & Styling", "Bildung", "Wissenschaft & Technik", "Soziales Engagement"}},
    {"fr", "fr-FR",
     {"Films et animations", "Auto/Moto", "Musique", "Animaux", "Sports", "Voyages et événements",
      "Jeux vidéo", "People et blogs", "Humour", "Divertissement", "Actualités et politique",
      "Vie pratique et style", "Éducation", "Science et technologie", "Organisations à but non lucratif"}},
    {"es", "es-ES",
     {"Cine y animación", "Motor", "Música", "Mascotas y animales", "Deportes", "Viajes y eventos",
      "Videojuegos", "Gente y blogs", "Comedia", "Entretenimiento", "Noticias y política",
      "Consejos y estilo", "Educación", "Ciencia y tecnología", "ONG y activismo"}},
    {"ja", "ja-JP",
     {"映画とアニメ", "自動車と乗り物", "音楽", "ペットと動物", "スポーツ", "旅行とイベント", "ゲーム",
      "ブログ", "コメディー", "エンターテイメント", "ニュースと政治", "ハウツーとスタイル", "教育",
      "科学と技術", "非営利団体と社会活動"}},
};

std::string xml_escape(const char *text)
{
    std::string out;
    for (const char *p = text; *p; p++) {
        switch (*p) {
        case '&': out += "&amp;"; break;
        case '<': out += "&lt;"; break;
        case '>': out += "&gt;"; break;
        case '"': out += "&quot;"; break;
        default: out.push_back(*p);
        }
    }
    return out;
}

} // namespace

bool category_document(const std::string &language, const std::string &host, std::string *out)
{
    std::string code;
    for (char c : language) {
        if (c == '-' || c == '_')
            break;
        code.push_back(static_cast<char>(tolower(static_cast<unsigned char>(c))));
    }
    if (code.empty())
        code = "en";
    const Language *lang = nullptr;
    for (const auto &l : kLanguages)
        if (code == l.code)
            lang = &l;
    if (!lang)
        return false;
    std::string scheme = "http://" + host + "/schemas/2007/categories.cat";
    std::string doc = "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n"
                      "<app:categories xmlns:app=\"http://www.w3.org/2007/app\" "
                      "xmlns:atom=\"http://www.w3.org/2005/Atom\" xmlns:zv=\"http://" +
                      host + "/schemas/2007\" fixed=\"yes\" scheme=\"" + scheme + "\">\n";
    for (size_t i = 0; i < kCategoryCount; i++) {
        doc += "  <atom:category term=\"" + std::string(kTerms[i]) + "\" label=\"" + xml_escape(lang->labels[i]) +
               "\" xml:lang=\"" + lang->xml_lang + "\"><zv:assignable/></atom:category>\n";
    }
    doc += "</app:categories>\n";
    *out = doc;
    return true;
}

std::string schema_document(const std::string &host)
{
    return "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n"
           "<zv:schema xmlns:zv=\"http://" + host + "/schemas/2007\">\n"
           "  <zv:categories href=\"http://" + host + "/schemas/2007/categories.cat\"/>\n"
           "</zv:schema>\n";
}

} // namespace zv_devserver
