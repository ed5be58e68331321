// What the development server answers: the metadata upload, the resumable data upload and its
// status query, the client login, the OAuth2 token endpoint, the data host's documents and the
// admin requests.
#include "zv-devserver.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>
#include <cstring>

#include "zv-devserver-categories.h"

namespace zv_devserver {

namespace {

const char kMetaPath[] = "/resumable/feeds/api/users/default/uploads";
const char kUploadPrefix[] = "/resumable/uploads/";
const char kLoginPath[] = "/accounts/ClientLogin";
const char kTokenPath[] = "/o/oauth2/token";
const char kCategoryPath[] = "/schemas/2007/categories.cat";
const char kSchemaPath[] = "/schemas/2007";
const char kAdminPrefix[] = "/_admin/";

// Bodies kept in memory (metadata, forms, admin requests) are refused beyond this size.
constexpr size_t kMemoryBodyLimit = 16 * 1024 * 1024;

bool starts_with(const std::string &s, const char *prefix)
{
    return s.compare(0, strlen(prefix), prefix) == 0;
}

const std::string *header_value(const Exchange &ex, const char *name)
{
    for (const auto &h : ex.headers)
        if (iequals(h.name, name))
            return &h.value;
    return nullptr;
}

std::string trim(const std::string &s)
{
    size_t b = s.find_first_not_of(" \t");
    size_t e = s.find_last_not_of(" \t");
    return b == std::string::npos ? "" : s.substr(b, e - b + 1);
}

Answer text_answer(int status, const std::string &text)
{
    Answer a;
    a.status = status;
    a.headers.push_back({"Content-Type", "text/plain; charset=utf-8"});
    a.body = text + "\n";
    return a;
}

Answer json_answer(int status, const std::string &json)
{
    Answer a;
    a.status = status;
    a.headers.push_back({"Content-Type", "application/json; charset=utf-8"});
    a.body = json;
    return a;
}

Answer method_not_allowed(const char *allowed)
{
    Answer a = text_answer(405, "method not allowed");
    a.headers.push_back({"Allow", allowed});
    return a;
}

// The upload's state as the client reads it: the held range, and the entity tag when done.
void add_upload_headers(Answer *a, const Upload &u)
{
    if (u.complete)
        a->headers.push_back({"ETag", "\"" + u.id + "\""});
    if (u.held > 0)
        a->headers.push_back({"Range", "bytes=0-" + std::to_string(u.held - 1)});
}

bool parse_int64(const std::string &text, int64_t *out)
{
    if (text.empty())
        return false;
    errno = 0;
    char *end = nullptr;
    long long v = strtoll(text.c_str(), &end, 10);
    if (errno != 0 || *end != '\0')
        return false;
    *out = v;
    return true;
}

// "bytes a-b/T" (T may be "*"); b may be a - 1 for an empty range.
bool parse_content_range(const std::string &value, int64_t *a, int64_t *b, int64_t *total)
{
    std::string v = trim(value);
    if (!starts_with(v, "bytes "))
        return false;
    v = trim(v.substr(6));
    size_t slash = v.find('/');
    if (slash == std::string::npos)
        return false;
    std::string range = v.substr(0, slash), t = v.substr(slash + 1);
    size_t dash = range.find('-', 1);
    if (dash == std::string::npos)
        return false;
    if (!parse_int64(range.substr(0, dash), a) || !parse_int64(range.substr(dash + 1), b))
        return false;
    if (t == "*")
        *total = -1;
    else if (!parse_int64(t, total) || *total < 0)
        return false;
    return *a >= 0;
}

bool write_file(const std::string &path, const std::string &data)
{
    int fd = open(path.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0644);
    if (fd < 0)
        return false;
    size_t off = 0;
    while (off < data.size()) {
        ssize_t n = write(fd, data.data() + off, data.size() - off);
        if (n < 0 && errno == EINTR)
            continue;
        if (n <= 0)
            break;
        off += static_cast<size_t>(n);
    }
    return close(fd) == 0 && off == data.size();
}

} // namespace

void Server::classify(Exchange *ex)
{
    const std::string &p = ex->path;
    if (p == kMetaPath) {
        ex->kind = Kind::Meta;
    } else if (starts_with(p, kUploadPrefix)) {
        ex->upload_id = p.substr(strlen(kUploadPrefix));
        const std::string *cr = header_value(*ex, "Content-Range");
        ex->kind = cr && starts_with(trim(*cr), "bytes */") ? Kind::Status : Kind::Data;
    } else if (p == kLoginPath) {
        ex->kind = Kind::Login;
    } else if (p == kTokenPath) {
        ex->kind = Kind::Token;
    } else if (p == kCategoryPath) {
        ex->kind = Kind::Category;
    } else if (p == kSchemaPath || p == std::string(kSchemaPath) + "/") {
        ex->kind = Kind::Schema;
    } else if (starts_with(p, kAdminPrefix)) {
        ex->kind = Kind::Admin;
    } else {
        ex->kind = Kind::Other;
    }
}

void Server::route_begin(Exchange *ex)
{
    auto refuse = [ex](Answer a) {
        ex->answer = std::move(a);
        ex->sink = Sink::Discard;
    };
    switch (ex->kind) {
    case Kind::Meta: {
        if (ex->method != "POST")
            return refuse(method_not_allowed("POST"));
        if (!config_.tokens.empty()) {
            const std::string *auth = header_value(*ex, "Authorization");
            std::string token = auth && starts_with(*auth, "Bearer ") ? auth->substr(7) : "";
            bool known = !token.empty() && token == config_.issued_token;
            for (const auto &t : config_.tokens)
                known = known || (!token.empty() && token == t);
            if (!known) {
                Answer a = text_answer(401, "invalid or missing bearer token");
                a.headers.push_back({"WWW-Authenticate", "Bearer realm=\"zuvo\", error=\"invalid_token\""});
                return refuse(a);
            }
        }
        if (config_.api_key) {
            const std::string *key = header_value(*ex, "X-ZvData-Key");
            if (!key || *key != "key=" + *config_.api_key)
                return refuse(text_answer(403, "invalid or missing developer key"));
        }
        ex->sink = Sink::Memory;
        return;
    }
    case Kind::Data:
        if (ex->method != "PUT")
            return refuse(method_not_allowed("PUT"));
        return begin_data(ex);
    case Kind::Status: {
        if (ex->method != "PUT")
            return refuse(method_not_allowed("PUT"));
        ex->upload = find_upload(ex->upload_id);
        if (!ex->upload)
            return refuse(text_answer(404, "no such upload"));
        // The client asks because it gave up its data PUT: one still in flight writes no more.
        std::lock_guard<std::mutex> lock(ex->upload->mutex);
        ex->upload->generation++;
        ex->sink = Sink::Discard;
        return;
    }
    case Kind::Login:
    case Kind::Token:
        if (ex->method != "POST")
            return refuse(method_not_allowed("POST"));
        ex->sink = Sink::Memory;
        return;
    case Kind::Category:
    case Kind::Schema:
        if (ex->method != "GET" && ex->method != "HEAD")
            return refuse(method_not_allowed("GET"));
        ex->sink = Sink::Discard;
        return;
    case Kind::Admin:
        if (!ex->loopback)
            return refuse(text_answer(403, "admin requests are taken from loopback only"));
        ex->sink = Sink::Memory;
        return;
    case Kind::Other:
        return refuse(text_answer(404, "not found"));
    }
}

void Server::begin_data(Exchange *ex)
{
    auto refuse = [ex](Answer a) {
        ex->answer = std::move(a);
        ex->sink = Sink::Discard;
    };
    ex->upload = find_upload(ex->upload_id);
    if (!ex->upload)
        return refuse(text_answer(404, "no such upload"));
    Upload &u = *ex->upload;
    const std::string *cr = header_value(*ex, "Content-Range");
    std::lock_guard<std::mutex> lock(u.mutex);
    if (u.complete) {
        Answer a = text_answer(200, "upload already complete");
        add_upload_headers(&a, u);
        return refuse(a);
    }
    if (!cr) {
        ex->whole_body = true;
        u.held = 0;
        u.total = ex->has_length ? static_cast<int64_t>(ex->content_length) : -1;
    } else {
        int64_t a = 0, b = 0, total = 0;
        if (!parse_content_range(*cr, &a, &b, &total))
            return refuse(text_answer(400, "bad Content-Range: " + *cr));
        if (total >= 0 && u.total >= 0 && total != u.total)
            return refuse(text_answer(400, "Content-Range total " + std::to_string(total) + " differs from " +
                                                std::to_string(u.total)));
        if (static_cast<uint64_t>(a) != u.held) {
            Answer r = text_answer(416, "the next byte this upload lacks is " + std::to_string(u.held));
            add_upload_headers(&r, u);
            return refuse(r);
        }
        if (b < a - 1 || (total >= 0 && b >= total))
            return refuse(text_answer(400, "bad Content-Range: " + *cr));
        uint64_t length = static_cast<uint64_t>(b + 1 - a);
        if (ex->has_length && ex->content_length != length)
            return refuse(text_answer(400, "Content-Length " + std::to_string(ex->content_length) +
                                                " does not match Content-Range " + *cr));
        if (total >= 0)
            u.total = total;
        ex->expected = length;
    }
    if (!config_.discard_data) {
        int flags = O_WRONLY | O_CREAT | O_CLOEXEC | (ex->whole_body ? O_TRUNC : 0);
        ex->fd = open(u.data_path.c_str(), flags, 0644);
        if (ex->fd < 0 || ftruncate(ex->fd, static_cast<off_t>(u.held)) != 0 ||
            lseek(ex->fd, static_cast<off_t>(u.held), SEEK_SET) < 0)
            return refuse(text_answer(500, std::string("cannot write the upload: ") + strerror(errno)));
    }
    // This PUT takes the upload over: an older one still in flight writes no more.
    ex->generation = ++u.generation;
    ex->sink = Sink::Upload;
}

bool Server::route_consume(Exchange *ex, const char *data, size_t size)
{
    switch (ex->sink) {
    case Sink::Discard:
        return true;
    case Sink::Memory:
        if (ex->body.size() + size > kMemoryBodyLimit) {
            ex->body_too_large = true;
            ex->body.clear();
            ex->sink = Sink::Discard;
        } else {
            ex->body.append(data, size);
        }
        return true;
    case Sink::Upload:
        break;
    }
    Upload &u = *ex->upload;
    std::lock_guard<std::mutex> lock(u.mutex);
    if (u.generation != ex->generation) {
        ex->outcome = "superseded";
        return false;
    }
    if (!ex->whole_body && ex->written + size > ex->expected) {
        size = static_cast<size_t>(ex->expected - ex->written);
        ex->overflow = true;
    }
    if (config_.discard_data) {
        u.held += size;
        ex->written += size;
        return true;
    }
    size_t off = 0;
    while (off < size) {
        ssize_t n = write(ex->fd, data + off, size - off);
        if (n < 0 && errno == EINTR)
            continue;
        if (n <= 0) {
            ex->outcome = "write-error";
            return false;
        }
        off += static_cast<size_t>(n);
        u.held += static_cast<uint64_t>(n);
        ex->written += static_cast<uint64_t>(n);
    }
    return true;
}

Answer Server::route_finish(Exchange *ex)
{
    if (ex->body_too_large)
        return text_answer(413, "body too large");
    switch (ex->kind) {
    case Kind::Meta:
        return finish_meta(ex);
    case Kind::Data:
        return finish_data(ex);
    case Kind::Status:
        return finish_status(ex);
    case Kind::Login:
        return finish_login(ex);
    case Kind::Token:
        return finish_token(ex);
    case Kind::Category: {
        Fields query = parse_fields(ex->query, "&");
        const std::string *hl = find_field(query, "hl");
        Answer a;
        if (!category_document(hl ? *hl : "", ex->host, &a.body))
            return text_answer(404, "no category document for language " + (hl ? *hl : std::string()));
        a.status = 200;
        a.headers.push_back({"Content-Type", "application/atomcat+xml; charset=UTF-8"});
        return a;
    }
    case Kind::Schema: {
        Answer a;
        a.status = 200;
        a.headers.push_back({"Content-Type", "application/xml; charset=UTF-8"});
        a.body = schema_document(ex->host);
        return a;
    }
    case Kind::Admin:
        return finish_admin(ex);
    case Kind::Other:
        break;
    }
    return text_answer(404, "not found");
}

void Server::route_end(Exchange *ex)
{
    if (ex->fd >= 0) {
        close(ex->fd);
        ex->fd = -1;
    }
}

Answer Server::finish_meta(Exchange *ex)
{
    if (ex->body.empty())
        return text_answer(400, "the metadata document is missing");
    auto u = std::make_shared<Upload>();
    for (;;) {
        u->id = random_hex(16);
        std::lock_guard<std::mutex> lock(uploads_mutex_);
        if (!uploads_.count(u->id))
            break;
    }
    u->url = ex->scheme_host + kUploadPrefix + u->id;
    u->data_path = config_.storage + "/" + u->id + ".data";
    u->meta_path = config_.storage + "/" + u->id + ".atom.xml";
    if (const std::string *slug = header_value(*ex, "Slug"))
        u->slug = *slug;
    if (!write_file(u->meta_path, ex->body) || !write_file(u->data_path, ""))
        return text_answer(500, std::string("cannot store the upload: ") + strerror(errno));
    {
        std::lock_guard<std::mutex> lock(uploads_mutex_);
        uploads_[u->id] = u;
        upload_order_.push_back(u->id);
    }
    ex->upload_id = u->id;
    Answer a;
    a.status = 201;
    a.headers.push_back({"Location", u->url});
    return a;
}

Answer Server::finish_data(Exchange *ex)
{
    Upload &u = *ex->upload;
    std::lock_guard<std::mutex> lock(u.mutex);
    if (ex->overflow)
        return text_answer(400, "the body is longer than its Content-Range; the excess was dropped");
    if (ex->whole_body)
        u.total = static_cast<int64_t>(u.held);
    if (u.total >= 0 && u.held == static_cast<uint64_t>(u.total))
        u.complete = true;
    Answer a;
    a.status = u.complete ? 201 : 308;
    add_upload_headers(&a, u);
    return a;
}

Answer Server::finish_status(Exchange *ex)
{
    Upload &u = *ex->upload;
    std::lock_guard<std::mutex> lock(u.mutex);
    Answer a;
    a.status = u.complete ? 200 : 308;
    add_upload_headers(&a, u);
    return a;
}

Answer Server::finish_login(Exchange *ex)
{
    Fields form = parse_fields(ex->body, "&");
    const std::string *email = find_field(form, "Email");
    const std::string *passwd = find_field(form, "Passwd");
    if (!email || !passwd)
        return json_answer(400, "{\n  \"error\": \"BadAuthentication\",\n  \"error_description\": \"Email and Passwd are required\"\n}\n");
    if ((config_.user && *email != *config_.user) || (config_.password && *passwd != *config_.password))
        return json_answer(403, "{\n  \"error\": \"BadAuthentication\"\n}\n");
    return json_answer(200, "{\n  \"Auth\": \"" + config_.issued_token + "\",\n  \"SID\": \"sid-" + random_hex(24) +
                                "\",\n  \"LSID\": \"lsid-" + random_hex(24) + "\"\n}\n");
}

Answer Server::finish_token(Exchange *ex)
{
    Fields form = parse_fields(ex->body, "&");
    auto field = [&form](const char *name) { return find_field(form, name); };
    auto error = [](int status, const std::string &code, const std::string &why) {
        return json_answer(status, "{\n  \"error\": \"" + code + "\",\n  \"error_description\": \"" + why + "\"\n}\n");
    };
    const std::string *grant = field("grant_type");
    if (!grant || *grant != "refresh_token")
        return error(400, "unsupported_grant_type", "grant_type must be refresh_token");
    const std::string *id = field("client_id");
    const std::string *secret = field("client_secret");
    if (!id || !secret || (config_.client_id && *id != *config_.client_id) ||
        (config_.client_secret && *secret != *config_.client_secret))
        return error(401, "invalid_client", "The OAuth client was not found.");
    const std::string *refresh = field("refresh_token");
    if (!refresh || refresh->empty())
        return error(400, "invalid_request", "Missing required parameter: refresh_token");
    bool known = config_.refresh_tokens.empty();
    for (const auto &t : config_.refresh_tokens)
        known = known || t == *refresh;
    if (!known)
        return error(400, "invalid_grant", "Token has been expired or revoked.");
    return json_answer(200, "{\n  \"access_token\": \"" + config_.issued_token +
                                "\",\n  \"expires_in\": 3600,\n  \"token_type\": \"Bearer\"\n}\n");
}

Answer Server::finish_admin(Exchange *ex)
{
    std::string sub = ex->path.substr(strlen(kAdminPrefix));
    if (sub == "fault") {
        if (ex->method != "POST")
            return method_not_allowed("POST");
        Fields fields = parse_fields(ex->query, "&");
        std::string body = trim(ex->body);
        if (!body.empty() && body[0] == '{') {
            std::string why;
            if (!parse_flat_json(body, &fields, &why))
                return json_answer(400, "{\"error\":" + json_quote(why) + "}\n");
        } else if (!body.empty()) {
            Fields more = parse_fields(body, "&,\n");
            fields.insert(fields.end(), more.begin(), more.end());
        }
        std::string why;
        int id = faults_.add(fields, &why);
        if (id < 0)
            return json_answer(400, "{\"error\":" + json_quote(why) + "}\n");
        return json_answer(201, "{\"id\":" + std::to_string(id) + "}\n");
    }
    if (sub == "faults") {
        if (ex->method == "GET")
            return json_answer(200, faults_.to_json() + "\n");
        if (ex->method == "DELETE") {
            faults_.clear();
            return json_answer(200, "{\"cleared\":true}\n");
        }
        return method_not_allowed("GET, DELETE");
    }
    if (sub == "uploads" || starts_with(sub, "uploads/")) {
        if (ex->method != "GET")
            return method_not_allowed("GET");
        if (sub != "uploads") {
            auto u = find_upload(sub.substr(strlen("uploads/")));
            if (!u)
                return json_answer(404, "{\"error\":\"no such upload\"}\n");
            return json_answer(200, upload_json(*u) + "\n");
        }
        std::vector<std::shared_ptr<Upload>> list;
        {
            std::lock_guard<std::mutex> lock(uploads_mutex_);
            for (const auto &id : upload_order_)
                list.push_back(uploads_[id]);
        }
        std::string out = "[";
        for (size_t i = 0; i < list.size(); i++)
            out += (i ? "," : "") + upload_json(*list[i]);
        return json_answer(200, out + "]\n");
    }
    return json_answer(404, "{\"error\":\"no such admin request\"}\n");
}

std::shared_ptr<Upload> Server::find_upload(const std::string &id)
{
    std::lock_guard<std::mutex> lock(uploads_mutex_);
    auto it = uploads_.find(id);
    return it == uploads_.end() ? nullptr : it->second;
}

std::string Server::upload_json(Upload &u)
{
    int64_t total;
    uint64_t held;
    bool complete;
    {
        std::lock_guard<std::mutex> lock(u.mutex);
        total = u.total;
        held = u.held;
        complete = u.complete;
    }
    return "{\"id\":" + json_quote(u.id) + ",\"url\":" + json_quote(u.url) + ",\"slug\":" + json_quote(u.slug) +
           ",\"total\":" + std::to_string(total) + ",\"held\":" + std::to_string(held) +
           ",\"complete\":" + (complete ? "true" : "false") + ",\"path\":" + json_quote(u.data_path) +
           ",\"meta_path\":" + json_quote(u.meta_path) + ",\"sha256\":\"" +
           (config_.discard_data ? "" : sha256_file(u.data_path, held)) + "\"}";
}

} // namespace zv_devserver
