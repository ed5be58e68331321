#include "zv-test-server.h"

#include <curl/curl.h>
#include <glib.h>
#include <poll.h>
#include <signal.h>
#include <string.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <sstream>

namespace zv_test {

namespace {

size_t collect(char *data, size_t size, size_t n, void *out)
{
    static_cast<std::string *>(out)->append(data, size * n);
    return size * n;
}

// The JSON string whose opening quote is at text[pos]; pos ends past its closing quote.
std::string json_string(const std::string &text, size_t &pos)
{
    std::string out;
    for (pos++; pos < text.size() && text[pos] != '"'; pos++) {
        const char *escape = text[pos] == '\\' ? strchr("nrt", text[++pos]) : nullptr;
        out += escape ? "\n\r\t"[escape - "nrt"] : text[pos];
    }
    pos++;
    return out;
}

// The flat objects of a JSON array.
std::vector<std::string> json_objects(const std::string &array)
{
    std::vector<std::string> list;
    for (size_t at = 0, end; (at = array.find('{', at)) != std::string::npos &&
                             (end = array.find('}', at)) != std::string::npos;
         at = end + 1)
        list.push_back(array.substr(at, end - at + 1));
    return list;
}

// A member of a flat JSON object: a string unescaped, anything else as written; "" when absent.
std::string json_get(const std::string &object, const std::string &key)
{
    size_t pos = object.find("\"" + key + "\":");
    if (pos == std::string::npos)
        return "";
    pos += key.size() + 3;
    if (object[pos] == '"')
        return json_string(object, pos);
    return object.substr(pos, object.find_first_of(",}]", pos) - pos);
}

long long json_number(const std::string &object, const std::string &key)
{
    std::string text = json_get(object, key);
    return text.empty() ? -1 : atoll(text.c_str());
}

} // namespace

Reply http(const std::string &method, const std::string &url,
           const std::vector<std::string> &headers, const std::string &body)
{
    Reply r;
    CURL *c = curl_easy_init();
    curl_slist *list = curl_slist_append(nullptr, "Expect:");
    for (const auto &h : headers)
        list = curl_slist_append(list, h.c_str());
    curl_easy_setopt(c, CURLOPT_URL, url.c_str());
    curl_easy_setopt(c, CURLOPT_NOPROXY, "*");
    curl_easy_setopt(c, CURLOPT_HTTPHEADER, list);
    curl_easy_setopt(c, CURLOPT_TIMEOUT, 60L);
    curl_easy_setopt(c, CURLOPT_WRITEFUNCTION, collect);
    curl_easy_setopt(c, CURLOPT_WRITEDATA, &r.body);
    curl_easy_setopt(c, CURLOPT_HEADERFUNCTION, collect);
    curl_easy_setopt(c, CURLOPT_HEADERDATA, &r.headers);
    if (!body.empty() || method == "POST" || method == "PUT") {
        curl_easy_setopt(c, CURLOPT_POSTFIELDS, body.c_str());
        curl_easy_setopt(c, CURLOPT_POSTFIELDSIZE, static_cast<long>(body.size()));
    }
    if (method != "GET")
        curl_easy_setopt(c, CURLOPT_CUSTOMREQUEST, method.c_str());
    curl_easy_perform(c);
    curl_easy_getinfo(c, CURLINFO_RESPONSE_CODE, &r.status);
    curl_slist_free_all(list);
    curl_easy_cleanup(c);
    return r;
}

std::string Reply::header(const std::string &name) const
{
    size_t at = headers.find("\r\n" + name + ": ");
    if (at == std::string::npos)
        return "";
    at += name.size() + 4;
    return headers.substr(at, headers.find("\r\n", at) - at);
}

std::string Logged::get(const std::string &key) const
{
    return json_get(line, key);
}

Logged::Logged(const std::string &l)
    : line(l), kind(get("kind")), upload_id(get("upload_id")), seq(json_number(l, "seq")),
      status(json_number(l, "status")), body_length(json_number(l, "body_length"))
{
    size_t pos = line.find("\"headers\":[") + 11;
    while (line.compare(pos, 2, "[\"") == 0) {
        pos++;
        std::string name = json_string(line, pos);
        pos++; // ','
        headers.emplace_back(name, json_string(line, pos));
        pos += line.compare(pos, 2, "],") == 0 ? 2 : 1;
    }
}

std::string Logged::body() const
{
    gsize len = 0;
    guchar *bytes = g_base64_decode(get("body_base64").c_str(), &len);
    std::string out(reinterpret_cast<char *>(bytes), len);
    g_free(bytes);
    return out;
}

std::optional<std::string> Logged::header(const std::string &name) const
{
    for (const auto &h : headers)
        if (h.first == name)
            return h.second;
    return std::nullopt;
}

long long Logged::range_start() const
{
    std::string range = header("Content-Range").value_or("");
    return range.size() > 6 && isdigit((unsigned char)range[6]) ? atoll(range.c_str() + 6) : -1;
}

pid_t spawn_server(const std::vector<std::string> &argv, int *port, int *tls_port)
{
    int out = -1;
    pid_t pid = spawn_piped(argv, nullptr, &out);
    std::string text;
    char buf[256];
    pollfd pfd = {out, POLLIN, 0};
    ssize_t n = 0;
    while (std::count(text.begin(), text.end(), '\n') < (tls_port ? 2 : 1) &&
           poll(&pfd, 1, 20000) > 0 && (n = read(out, buf, sizeof buf)) > 0)
        text.append(buf, (size_t)n);
    close(out);
    // Each port is the last number on its line.
    std::istringstream lines(text);
    for (int *p : {port, tls_port}) {
        std::string line;
        if (p && std::getline(lines, line))
            *p = atoi(line.c_str() + line.find_last_not_of("0123456789") + 1);
    }
    return pid;
}

bool DevServer::start(const std::string &dir, const std::vector<std::string> &args)
{
    dir_ = dir;
    mkdir(dir.c_str(), 0700);
    std::vector<std::string> argv = {bin_path("zuvo-devserver"), "--storage", dir + "/store",
                                     "--log", log_path()};
    argv.insert(argv.end(), args.begin(), args.end());
    bool tls = std::count(args.begin(), args.end(), "--tls-port") > 0;
    pid_ = spawn_server(argv, &port_, tls ? &tls_port_ : nullptr);
    return pid_ > 0 && port_ > 0 && (!tls || tls_port_ > 0);
}

int DevServer::stop()
{
    int status = 0;
    if (pid_ <= 0 || kill(pid_, SIGTERM) != 0 || waitpid(pid_, &status, 0) != pid_)
        status = -1;
    pid_ = -1;
    return status >= 0 && WIFEXITED(status) ? WEXITSTATUS(status) : -1;
}

std::vector<Logged> DevServer::requests() const
{
    std::vector<Logged> all;
    std::istringstream lines(read_file(log_path()));
    for (std::string line; std::getline(lines, line);)
        all.emplace_back(line);
    return all;
}

std::vector<Logged> DevServer::requests_of(const std::string &upload_id) const
{
    std::vector<Logged> list;
    for (const Logged &r : requests())
        if (r.upload_id == upload_id)
            list.push_back(r);
    return list;
}

long long DevServer::fired(const std::string &action) const
{
    long long total = 0;
    for (const std::string &o : json_objects(http("GET", url("/_admin/faults")).body))
        if (json_get(o, "action") == action)
            total += json_number(o, "fired");
    return total;
}

// The upload's id ends its address; the server reads (and hashes) that one copy alone. No
// address (a row not sent yet) asks nothing.
Upload DevServer::upload_of_url(const std::string &upload_url) const
{
    if (upload_url.empty())
        return Upload();
    const std::string id = upload_url.substr(upload_url.rfind('/') + 1);
    for (const std::string &o : json_objects(http("GET", url("/_admin/uploads/" + id)).body))
        if (json_get(o, "url") == upload_url)
            return {id, upload_url, json_get(o, "path"), json_number(o, "total"),
                    json_number(o, "held"), json_get(o, "complete") == "true"};
    return Upload();
}

} // namespace zv_test
