// Fault rules of the development server (see zv-devserver-faults.h).
#include "zv-devserver-faults.h"

#include <algorithm>
#include <cerrno>
#include <cmath>
#include <cstdio>
#include <cstdlib>

namespace zv_devserver {

namespace {

// An answer header block the client must refuse is larger than 5,242,880 bytes.
constexpr int64_t kDefaultBigHeader = 6 * 1024 * 1024;

bool parse_int(const std::string &text, int64_t min, int64_t *out)
{
    if (text.empty())
        return false;
    errno = 0;
    char *end = nullptr;
    long long v = strtoll(text.c_str(), &end, 10);
    if (errno != 0 || *end != '\0' || v < min)
        return false;
    *out = v;
    return true;
}

bool parse_positive(const std::string &text, double *out)
{
    if (text.empty())
        return false;
    char *end = nullptr;
    double v = strtod(text.c_str(), &end);
    if (*end != '\0' || !std::isfinite(v) || v <= 0)
        return false;
    *out = v;
    return true;
}

bool known_kind(const std::string &name)
{
    static const char *names[] = {"any", "meta", "data", "status", "login", "token", "category", "schema", "other"};
    for (const char *n : names)
        if (name == n)
            return true;
    return false;
}

std::string number_text(double v)
{
    char buf[64];
    snprintf(buf, sizeof buf, "%g", v);
    return buf;
}

} // namespace

const char *kind_name(Kind kind)
{
    switch (kind) {
    case Kind::Meta: return "meta";
    case Kind::Data: return "data";
    case Kind::Status: return "status";
    case Kind::Login: return "login";
    case Kind::Token: return "token";
    case Kind::Category: return "category";
    case Kind::Schema: return "schema";
    case Kind::Admin: return "admin";
    case Kind::Other: return "other";
    }
    return "other";
}

int FaultTable::add(const Fields &fields, std::string *error)
{
    Rule rule;
    bool has_bytes = false, has_rate = false, has_seconds = false, has_status = false;
    for (const auto &f : fields) {
        const std::string &key = f.first, &value = f.second;
        bool ok = true;
        if (key == "kind") {
            rule.kind = value;
            ok = known_kind(value);
        } else if (key == "action") {
            rule.action = value;
        } else if (key == "nth") {
            ok = parse_int(value, 1, &rule.nth);
        } else if (key == "times") {
            ok = parse_int(value, 0, &rule.times);
        } else if (key == "status") {
            int64_t s = 0;
            ok = parse_int(value, 100, &s) && s <= 599;
            rule.status = static_cast<int>(s);
            has_status = true;
        } else if (key == "body") {
            rule.body = value;
            rule.has_body = true;
        } else if (key == "bytes") {
            ok = parse_int(value, 0, &rule.bytes);
            has_bytes = true;
        } else if (key == "rate") {
            ok = parse_positive(value, &rule.rate);
            has_rate = true;
        } else if (key == "seconds") {
            ok = parse_positive(value, &rule.seconds);
            has_seconds = true;
        } else {
            *error = "unknown fault field \"" + key + "\"";
            return -1;
        }
        if (!ok) {
            *error = "bad value for fault field \"" + key + "\": \"" + value + "\"";
            return -1;
        }
    }
    if (rule.kind.empty()) {
        *error = "a fault needs kind (any, meta, data, status, login, token, category, schema, other)";
        return -1;
    }
    const std::string &a = rule.action;
    if (a == "status") {
        if (!has_status) {
            *error = "fault action status needs status=CODE";
            return -1;
        }
    } else if (a == "cut") {
        if (!has_bytes) {
            *error = "fault action cut needs bytes=N";
            return -1;
        }
    } else if (a == "throttle") {
        if (!has_rate) {
            *error = "fault action throttle needs rate=BYTES_PER_SECOND";
            return -1;
        }
    } else if (a == "stall") {
        if (!has_seconds) {
            *error = "fault action stall needs seconds=T";
            return -1;
        }
    } else if (a == "nolocation") {
        if (rule.kind != "meta" && rule.kind != "any") {
            *error = "fault action nolocation applies to kind meta";
            return -1;
        }
    } else if (a == "bigheader") {
        if (!has_bytes)
            rule.bytes = kDefaultBigHeader;
    } else {
        *error = "a fault needs action (status, cut, throttle, stall, nolocation, bigheader)";
        return -1;
    }
    std::lock_guard<std::mutex> lock(mutex_);
    rule.id = next_id_++;
    rules_.push_back(rule);
    return rule.id;
}

FaultEffects FaultTable::take(Kind kind)
{
    FaultEffects fx;
    if (kind == Kind::Admin)
        return fx;
    std::string name = kind_name(kind);
    std::lock_guard<std::mutex> lock(mutex_);
    for (auto &r : rules_) {
        if (r.kind != "any" && r.kind != name)
            continue;
        r.seen++;
        bool fires = r.seen >= r.nth && (r.times == 0 || r.seen < r.nth + r.times);
        if (!fires)
            continue;
        if (r.action == "nolocation" && kind != Kind::Meta)
            continue;
        r.fired++;
        fx.fired.push_back(r.action);
        if (r.action == "status") {
            fx.status = r.status;
            fx.status_body = r.body;
            fx.has_status_body = r.has_body;
        } else if (r.action == "cut") {
            fx.cut_at = fx.cut_at < 0 ? r.bytes : std::min(fx.cut_at, r.bytes);
        } else if (r.action == "throttle") {
            fx.rate = fx.rate > 0 ? std::min(fx.rate, r.rate) : r.rate;
        } else if (r.action == "stall") {
            fx.stall += r.seconds;
        } else if (r.action == "nolocation") {
            fx.no_location = true;
        } else if (r.action == "bigheader") {
            fx.big_header = std::max(fx.big_header, r.bytes);
        }
    }
    return fx;
}

void FaultTable::clear()
{
    std::lock_guard<std::mutex> lock(mutex_);
    rules_.clear();
}

std::string FaultTable::to_json()
{
    std::lock_guard<std::mutex> lock(mutex_);
    std::string out = "[";
    for (size_t i = 0; i < rules_.size(); i++) {
        const Rule &r = rules_[i];
        if (i)
            out += ",";
        out += "{\"id\":" + std::to_string(r.id) + ",\"kind\":" + json_quote(r.kind) +
               ",\"action\":" + json_quote(r.action) + ",\"nth\":" + std::to_string(r.nth) +
               ",\"times\":" + std::to_string(r.times);
        if (r.action == "status")
            out += ",\"status\":" + std::to_string(r.status);
        if (r.has_body)
            out += ",\"body\":" + json_quote(r.body);
        if (r.action == "cut" || r.action == "bigheader")
            out += ",\"bytes\":" + std::to_string(r.bytes);
        if (r.action == "throttle")
            out += ",\"rate\":" + number_text(r.rate);
        if (r.action == "stall")
            out += ",\"seconds\":" + number_text(r.seconds);
        out += ",\"seen\":" + std::to_string(r.seen) + ",\"fired\":" + std::to_string(r.fired) + "}";
    }
    return out + "]";
}

} // namespace zv_devserver
