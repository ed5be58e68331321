// Text helpers of the development server (see zv-devserver-text.h).
#include "zv-devserver-text.h"

#include <fcntl.h>
#include <openssl/evp.h>
#include <unistd.h>

#include <cctype>
#include <cstdio>
#include <random>
#include <vector>

namespace zv_devserver {

namespace {

// Length of the UTF-8 sequence starting at s[i], or 0 when it is not a valid one.
size_t utf8_sequence(const std::string &s, size_t i)
{
    auto byte = [&](size_t k) { return static_cast<unsigned char>(s[k]); };
    unsigned char c = byte(i);
    size_t len;
    uint32_t cp;
    if (c < 0x80)
        return 1;
    if ((c & 0xE0) == 0xC0) {
        len = 2;
        cp = c & 0x1F;
    } else if ((c & 0xF0) == 0xE0) {
        len = 3;
        cp = c & 0x0F;
    } else if ((c & 0xF8) == 0xF0) {
        len = 4;
        cp = c & 0x07;
    } else {
        return 0;
    }
    if (i + len > s.size())
        return 0;
    for (size_t k = 1; k < len; k++) {
        if ((byte(i + k) & 0xC0) != 0x80)
            return 0;
        cp = (cp << 6) | (byte(i + k) & 0x3F);
    }
    static const uint32_t min_cp[] = {0, 0, 0x80, 0x800, 0x10000};
    if (cp < min_cp[len] || cp > 0x10FFFF || (cp >= 0xD800 && cp <= 0xDFFF))
        return 0;
    return len;
}

int hex_value(char c)
{
    if (c >= '0' && c <= '9')
        return c - '0';
    if (c >= 'a' && c <= 'f')
        return c - 'a' + 10;
    if (c >= 'A' && c <= 'F')
        return c - 'A' + 10;
    return -1;
}

void append_utf8(std::string *out, uint32_t cp)
{
    if (cp < 0x80) {
        out->push_back(static_cast<char>(cp));
    } else if (cp < 0x800) {
        out->push_back(static_cast<char>(0xC0 | (cp >> 6)));
        out->push_back(static_cast<char>(0x80 | (cp & 0x3F)));
    } else {
        out->push_back(static_cast<char>(0xE0 | (cp >> 12)));
        out->push_back(static_cast<char>(0x80 | ((cp >> 6) & 0x3F)));
        out->push_back(static_cast<char>(0x80 | (cp & 0x3F)));
    }
}

// A small reader of one flat JSON object.
class JsonReader {
public:
    explicit JsonReader(const std::string &text) : s_(text) {}

    bool read_object(Fields *fields, std::string *error)
    {
        skip_ws();
        if (!take('{'))
            return fail(error, "expected '{'");
        skip_ws();
        if (take('}'))
            return at_end(error);
        for (;;) {
            std::string key, value;
            skip_ws();
            if (!read_string(&key))
                return fail(error, "expected a member name");
            skip_ws();
            if (!take(':'))
                return fail(error, "expected ':'");
            skip_ws();
            if (!read_value(&value))
                return fail(error, "member \"" + key + "\" must be a string, number, boolean or null");
            fields->emplace_back(key, value);
            skip_ws();
            if (take(','))
                continue;
            if (take('}'))
                return at_end(error);
            return fail(error, "expected ',' or '}'");
        }
    }

private:
    bool fail(std::string *error, const std::string &why)
    {
        *error = "bad JSON at offset " + std::to_string(pos_) + ": " + why;
        return false;
    }
    bool at_end(std::string *error)
    {
        skip_ws();
        return pos_ == s_.size() || fail(error, "text after the object");
    }
    void skip_ws()
    {
        while (pos_ < s_.size() && isspace(static_cast<unsigned char>(s_[pos_])))
            pos_++;
    }
    bool take(char c)
    {
        if (pos_ < s_.size() && s_[pos_] == c) {
            pos_++;
            return true;
        }
        return false;
    }
    bool read_string(std::string *out)
    {
        if (!take('"'))
            return false;
        while (pos_ < s_.size()) {
            char c = s_[pos_++];
            if (c == '"')
                return true;
            if (c != '\\') {
                out->push_back(c);
                continue;
            }
            if (pos_ >= s_.size())
                return false;
            char e = s_[pos_++];
            switch (e) {
            case '"': case '\\': case '/': out->push_back(e); break;
            case 'b': out->push_back('\b'); break;
            case 'f': out->push_back('\f'); break;
            case 'n': out->push_back('\n'); break;
            case 'r': out->push_back('\r'); break;
            case 't': out->push_back('\t'); break;
            case 'u': {
                if (pos_ + 4 > s_.size())
                    return false;
                uint32_t cp = 0;
                for (int k = 0; k < 4; k++) {
                    int v = hex_value(s_[pos_++]);
                    if (v < 0)
                        return false;
                    cp = cp * 16 + static_cast<uint32_t>(v);
                }
                append_utf8(out, cp);
                break;
            }
            default:
                return false;
            }
        }
        return false;
    }
    bool read_value(std::string *out)
    {
        if (pos_ < s_.size() && s_[pos_] == '"')
            return read_string(out);
        size_t start = pos_;
        while (pos_ < s_.size() && (isalnum(static_cast<unsigned char>(s_[pos_])) || s_[pos_] == '-' ||
                                    s_[pos_] == '+' || s_[pos_] == '.'))
            pos_++;
        *out = s_.substr(start, pos_ - start);
        if (*out == "null") {
            out->clear();
            return true;
        }
        return !out->empty();
    }

    const std::string &s_;
    size_t pos_ = 0;
};

} // namespace

std::string json_quote(const std::string &text)
{
    static const char hex[] = "0123456789abcdef";
    std::string out;
    out.reserve(text.size() + 2);
    out.push_back('"');
    for (size_t i = 0; i < text.size();) {
        unsigned char c = static_cast<unsigned char>(text[i]);
        size_t len = utf8_sequence(text, i);
        if (len > 1) {
            out.append(text, i, len);
            i += len;
            continue;
        }
        i++;
        switch (c) {
        case '"': out += "\\\""; break;
        case '\\': out += "\\\\"; break;
        case '\n': out += "\\n"; break;
        case '\r': out += "\\r"; break;
        case '\t': out += "\\t"; break;
        default:
            if (c < 0x20 || c >= 0x7F || len == 0) {
                out += "\\u00";
                out.push_back(hex[c >> 4]);
                out.push_back(hex[c & 15]);
            } else {
                out.push_back(static_cast<char>(c));
            }
        }
    }
    out.push_back('"');
    return out;
}

std::string base64_encode(const std::string &data)
{
    static const char table[] = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";
    std::string out;
    out.reserve((data.size() + 2) / 3 * 4);
    size_t i = 0;
    for (; i + 2 < data.size(); i += 3) {
        uint32_t v = (static_cast<unsigned char>(data[i]) << 16) |
                     (static_cast<unsigned char>(data[i + 1]) << 8) | static_cast<unsigned char>(data[i + 2]);
        out.push_back(table[v >> 18]);
        out.push_back(table[(v >> 12) & 63]);
        out.push_back(table[(v >> 6) & 63]);
        out.push_back(table[v & 63]);
    }
    if (i < data.size()) {
        uint32_t v = static_cast<unsigned char>(data[i]) << 16;
        if (i + 1 < data.size())
            v |= static_cast<unsigned char>(data[i + 1]) << 8;
        out.push_back(table[v >> 18]);
        out.push_back(table[(v >> 12) & 63]);
        out.push_back(i + 1 < data.size() ? table[(v >> 6) & 63] : '=');
        out.push_back('=');
    }
    return out;
}

bool is_valid_utf8(const std::string &text)
{
    for (size_t i = 0; i < text.size();) {
        size_t len = utf8_sequence(text, i);
        if (len == 0 || text[i] == '\0')
            return false;
        i += len;
    }
    return true;
}

bool iequals(const std::string &a, const std::string &b)
{
    if (a.size() != b.size())
        return false;
    for (size_t i = 0; i < a.size(); i++)
        if (tolower(static_cast<unsigned char>(a[i])) != tolower(static_cast<unsigned char>(b[i])))
            return false;
    return true;
}

std::string percent_decode(const std::string &text, bool plus_is_space)
{
    std::string out;
    out.reserve(text.size());
    for (size_t i = 0; i < text.size(); i++) {
        char c = text[i];
        if (c == '%' && i + 2 < text.size()) {
            int hi = hex_value(text[i + 1]), lo = hex_value(text[i + 2]);
            if (hi >= 0 && lo >= 0) {
                out.push_back(static_cast<char>(hi * 16 + lo));
                i += 2;
                continue;
            }
        }
        out.push_back(plus_is_space && c == '+' ? ' ' : c);
    }
    return out;
}

Fields parse_fields(const std::string &text, const std::string &separators)
{
    Fields fields;
    size_t start = 0;
    while (start <= text.size()) {
        size_t end = text.find_first_of(separators, start);
        if (end == std::string::npos)
            end = text.size();
        std::string piece = text.substr(start, end - start);
        if (!piece.empty()) {
            size_t eq = piece.find('=');
            if (eq == std::string::npos)
                fields.emplace_back(percent_decode(piece, true), "");
            else
                fields.emplace_back(percent_decode(piece.substr(0, eq), true),
                                    percent_decode(piece.substr(eq + 1), true));
        }
        start = end + 1;
    }
    return fields;
}

const std::string *find_field(const Fields &fields, const std::string &name)
{
    for (const auto &f : fields)
        if (f.first == name)
            return &f.second;
    return nullptr;
}

bool parse_flat_json(const std::string &text, Fields *fields, std::string *error)
{
    return JsonReader(text).read_object(fields, error);
}

struct Sha256::Impl {
    EVP_MD_CTX *ctx = nullptr;
};

Sha256::Sha256() : impl_(new Impl)
{
    impl_->ctx = EVP_MD_CTX_new();
    if (impl_->ctx)
        EVP_DigestInit_ex(impl_->ctx, EVP_sha256(), nullptr);
}

Sha256::~Sha256()
{
    EVP_MD_CTX_free(impl_->ctx);
}

void Sha256::update(const void *data, size_t len)
{
    if (impl_->ctx && len > 0)
        EVP_DigestUpdate(impl_->ctx, data, len);
}

std::string Sha256::hex()
{
    unsigned char md[EVP_MAX_MD_SIZE];
    unsigned int len = 0;
    if (!impl_->ctx || EVP_DigestFinal_ex(impl_->ctx, md, &len) != 1)
        return "";
    static const char digits[] = "0123456789abcdef";
    std::string out;
    for (unsigned int i = 0; i < len; i++) {
        out.push_back(digits[md[i] >> 4]);
        out.push_back(digits[md[i] & 15]);
    }
    return out;
}

std::string sha256_file(const std::string &path, uint64_t limit)
{
    int fd = open(path.c_str(), O_RDONLY | O_CLOEXEC);
    if (fd < 0)
        return "";
    Sha256 digest;
    std::vector<char> buf(1 << 20);
    uint64_t left = limit;
    bool ok = true;
    while (left > 0) {
        ssize_t n = read(fd, buf.data(), left < buf.size() ? static_cast<size_t>(left) : buf.size());
        if (n < 0) {
            ok = false;
            break;
        }
        if (n == 0)
            break;
        digest.update(buf.data(), static_cast<size_t>(n));
        left -= static_cast<uint64_t>(n);
    }
    close(fd);
    return ok ? digest.hex() : "";
}

std::string random_hex(size_t len)
{
    static const char digits[] = "0123456789abcdef";
    std::random_device rd;
    std::string out;
    for (size_t i = 0; i < len; i++)
        out.push_back(digits[rd() & 15]);
    return out;
}

} // namespace zv_devserver
