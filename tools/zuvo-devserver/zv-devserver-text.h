// Text helpers of the development server: JSON and base64 output, form and query parsing,
// a flat JSON object reader for admin requests, and a streaming SHA-256.
#pragma once

#include <cstddef>
#include <cstdint>
#include <map>
#include <memory>
#include <string>
#include <utility>
#include <vector>

namespace zv_devserver {

using Fields = std::vector<std::pair<std::string, std::string>>;

// The text as a JSON string literal, quotes included. Bytes that are not valid UTF-8 are
// written as \u00XX of their byte value, so the result is always valid JSON.
std::string json_quote(const std::string &text);
std::string base64_encode(const std::string &data);
bool is_valid_utf8(const std::string &text);
bool iequals(const std::string &a, const std::string &b);

// Percent-decoding; with plus_is_space, '+' becomes a space (form bodies and queries).
std::string percent_decode(const std::string &text, bool plus_is_space);
// Splits "a=1&b=2" at the given separators, each field at its first '=', decoding both sides.
Fields parse_fields(const std::string &text, const std::string &separators);
// The value of the first field named name, or nullptr.
const std::string *find_field(const Fields &fields, const std::string &name);

// Reads a flat JSON object of string, number, boolean and null members into fields
// (numbers and booleans as their literal text). False with *error on anything else.
bool parse_flat_json(const std::string &text, Fields *fields, std::string *error);

// Streaming SHA-256 (OpenSSL); hex() ends the digest.
class Sha256 {
public:
    Sha256();
    ~Sha256();
    Sha256(const Sha256 &) = delete;
    Sha256 &operator=(const Sha256 &) = delete;
    void update(const void *data, size_t len);
    std::string hex();

private:
    struct Impl;
    std::unique_ptr<Impl> impl_;
};

// SHA-256 of the first limit bytes of a file (hex), or "" when it cannot be read.
std::string sha256_file(const std::string &path, uint64_t limit);

// Random lower-case hex text of the given length.
std::string random_hex(size_t len);

} // namespace zv_devserver
