// The service client against zuvo-devserver on loopback: what each request puts on the wire
// (read back from the server's request log), what reaches the response callback, and the
// refusals that happen before anything is sent. Grouped by request kind.
#include <gtest/gtest.h>
#include <key_storage.h>
#include <stdlib.h>
#include <string.h>
#include <unistd.h>

#include <algorithm>
#include <memory>
#include <mutex>
#include <optional>
#include <sstream>
#include <string>
#include <vector>

#include "zv-plugin-main.h"
#include "zv-plugin-xml.h"
#include "zv-test-server.h"

namespace {

using zv_test::Headers;
using zv_test::Logged;
using zv_test::read_file;
using zv_test::wait_for;

const char TOKEN[] = "access-token-1";
const char API_KEY[] = "api-key-1";
const char ISSUED_TOKEN[] = "issued-token-1";
const char USER_AGENT[] = "Mozilla/5.0 (Linux; Tizen 2.4; HALVANE QX-M410) AppleWebKit/537.3 "
                          "(KHTML, like Gecko) HalvaneBrowser/1.1 Mobile Safari/537.3";

zv_test::LogFile g_log; // before the first log line opens the file

// What reaches the handles' callbacks (worker thread).
struct Answer {
    int result, http_code, resp_type;
    std::optional<std::string> value;
};

struct Inbox {
    std::mutex mutex;
    std::vector<Answer> answers;
    std::vector<int> percents;

    std::vector<Answer> got()
    {
        std::lock_guard<std::mutex> lock(mutex);
        return answers;
    }
};

void on_answer(int result, ServiceResponse *resp, void *user_data)
{
    auto *inbox = static_cast<Inbox *>(user_data);
    std::lock_guard<std::mutex> lock(inbox->mutex);
    inbox->answers.push_back({result, resp->http_code, resp->resp_type,
                              resp->value ? std::optional<std::string>(resp->value)
                                          : std::nullopt});
}

void on_progress(ServiceRequest *, int percent, void *user_data)
{
    auto *inbox = static_cast<Inbox *>(user_data);
    std::lock_guard<std::mutex> lock(inbox->mutex);
    inbox->percents.push_back(percent);
}

// A handle whose answers and progress go to `inbox`.
struct Handle {
    ServiceRequest *h = zv_request_new();
    explicit Handle(Inbox *inbox = nullptr)
    {
        zv_set_callback_func(h, inbox ? on_answer : nullptr);
        zv_set_progress_callback_func(h, inbox ? on_progress : nullptr);
        zv_set_user_data(h, inbox);
    }
    ~Handle() { zv_request_free(h); }
};

class ClientTest : public ::testing::Test {
protected:
    void SetUp() override
    {
        g_log.mark();
        ASSERT_TRUE(zv_init_service());
        ASSERT_EQ(key_storage_set("zuvo.tizen.api.key", API_KEY), 0);
        start_server();
        std::string bytes(10000, '\0');
        for (size_t i = 0; i < bytes.size(); i++)
            bytes[i] = (char)(i * 7 + i / 256);
        ASSERT_TRUE(zv_test::write_file(clip_, bytes));
    }
    void TearDown() override { zv_finalize_service(); }

    // (Re)starts the server in a fresh folder with the fixture's arguments and `extra`.
    void start_server(const std::vector<std::string> &extra = {})
    {
        std::vector<std::string> args = server_args();
        args.insert(args.end(), extra.begin(), extra.end());
        server_ = std::make_unique<zv_test::DevServer>();
        ASSERT_TRUE(server_->start(tmp_.file("server" + std::to_string(++starts_)), args));
        for (const auto &kv : server_->env())
            setenv(kv.first.c_str(), kv.second.c_str(), 1);
    }
    virtual std::vector<std::string> server_args()
    {
        return {"--token", TOKEN, "--api-key", API_KEY};
    }

    // Messages the client (not the engine) logged at error level since the test began.
    std::vector<std::string> errors() const
    {
        std::vector<std::string> out;
        std::istringstream lines(g_log.since_mark());
        for (std::string line; std::getline(lines, line);) {
            const size_t at = line.find("\033[31m[TID:");
            if (line.rfind("E/zuvo-plugin(", 0) != 0 || at == std::string::npos ||
                line.find(": zv-plugin-main.cpp: ") == std::string::npos)
                continue;
            const size_t msg = line.find("] ", at) + 2;
            out.push_back(line.substr(msg, line.size() - msg - strlen("\033[0m")));
        }
        return out;
    }

    // Issues the request and waits for its answer.
    Answer send(int (*request)(ServiceRequest *), const Handle &handle)
    {
        const size_t before = inbox_.got().size();
        EXPECT_EQ(request(handle.h), 0);
        EXPECT_TRUE(wait_for([&] { return inbox_.got().size() > before; }, 60000));
        return inbox_.got().size() > before ? inbox_.got().back() : Answer{1, 1, 1, std::nullopt};
    }
    void set_meta(const Handle &meta, const char *token = TOKEN)
    {
        zv_set_attr_token(meta.h, token);
        zv_set_attr_title(meta.h, "Clip &amp; co");
        zv_set_attr_category(meta.h, "Film");
        zv_set_attr_file_path(meta.h, clip_.c_str());
    }
    // A new upload on the server: its address.
    std::string create_upload()
    {
        Handle meta(&inbox_);
        set_meta(meta);
        return send(zv_request_meta_upload, meta).value.value_or("");
    }
    Answer data_upload(const std::string &url, int64_t offset, const std::string &path)
    {
        Handle data(&inbox_);
        zv_set_attr_upload_url(data.h, url.c_str());
        zv_set_attr_file_offset(data.h, offset);
        zv_set_attr_file_path(data.h, path.c_str());
        return send(zv_request_data_upload, data);
    }
    Answer status_query(const std::string &url)
    {
        Handle query(&inbox_);
        zv_set_attr_upload_url(query.h, url.c_str());
        return send(zv_request_upload_query, query);
    }

    zv_test::TempDir tmp_;
    std::unique_ptr<zv_test::DevServer> server_;
    const std::string clip_ = tmp_.file("clip.mp4");
    Inbox inbox_;
    int starts_ = 0;
};

// --- Service lifetime, attributes and refusals ---

TEST_F(ClientTest, ServiceStartsOnceAndStopsOnce)
{
    zv_finalize_service();
    zv_finalize_service();
    EXPECT_TRUE(zv_init_service());
    EXPECT_TRUE(zv_init_service());
    EXPECT_TRUE(g_log.logged("] Not yet start servie\n"));
    EXPECT_TRUE(g_log.logged("] Already init servie\n"));
    EXPECT_FALSE(create_upload().empty()); // the restarted engine serves requests
}

TEST_F(ClientTest, MissingValuesAreRefusedBeforeAnyTransfer)
{
    Handle a, m, d, l;
    // Each row may first set what the previous row lacked; rows run in order.
    const struct {
        int result, code;
        const char *message;
    } rows[] = {
        {zv_set_attr_user_id(a.h, nullptr), -996, "id is NULL"},
        {zv_set_attr_user_pwd(a.h, nullptr), -995, "pwd is NULL"},
        {zv_set_attr_token(a.h, nullptr), -994, "token is NULL"},
        {zv_set_attr_upload_url(a.h, nullptr), -983, "url is NULL"},
        {zv_set_attr_title(a.h, nullptr), -993, "title is NULL"},
        {zv_set_attr_description(a.h, nullptr), -992, "description is NULL"},
        {zv_set_attr_category(a.h, nullptr), -991, "category is NULL"},
        {zv_set_attr_keyword(a.h, nullptr), -990, "keyword is NULL"},
        {zv_set_attr_file_path(a.h, nullptr), -988, "file_path is NULL"},
        {zv_set_attr_file_offset(a.h, -1), -987, "invalid offset value"},
        {zv_set_attr_file_offset(a.h, INT64_MAX), -987, "invalid offset value"}, // n + 1
        {zv_set_attr_region(a.h, nullptr), -986, "region is NULL"},
        {zv_set_attr_location(a.h, nullptr), -985, "location is NULL"},
        {zv_set_attr_refresh_token(a.h, nullptr), -994, "refresh_token is NULL"},
        {zv_set_attr_gps(nullptr, 1, 2), -997, "handle is NULL"},
        {zv_set_callback_func(nullptr, on_answer), -997, "handle is NULL"},
        {zv_request_free(nullptr), -997, "handle data is NULL"},
        {zv_request_meta_upload(m.h), -994, "token is NULL"},
        {(zv_set_attr_token(m.h, TOKEN), zv_request_meta_upload(m.h)), -993, "title is NULL"},
        {(zv_set_attr_title(m.h, "t"), zv_request_meta_upload(m.h)), -991, "category is NULL"},
        {(zv_set_attr_category(m.h, "c"), zv_request_meta_upload(m.h)), -988, "file path is NULL"},
        {zv_request_data_upload(d.h), -988, "file_path data is NULL"},
        {(zv_set_attr_file_path(d.h, clip_.c_str()), zv_request_data_upload(d.h)), -983,
         "upload_url data is NULL"},
        {zv_request_upload_query(d.h), -983, "upload_url data is NULL"},
        // Byte 10001 of a file of 10000 bytes.
        {(zv_set_attr_upload_url(d.h, "http://127.0.0.1:9/u"), zv_set_attr_file_offset(d.h, 10000),
          zv_request_data_upload(d.h)),
         -987, "invalid offset value"},
        {zv_request_upload_pause(d.h), -998, "curl data is NULL"},
        {zv_request_upload_resume(d.h), -998, "curl data is NULL"},
        {zv_request_upload_cancel(d.h), -998, "curl data is NULL"},
        {zv_request_login(l.h), -996, "id is NULL"},
        {(zv_set_attr_user_id(l.h, "me"), zv_request_login(l.h)), -995, "pwd is NULL"},
        {zv_request_get_token(l.h), -994, "refresh toekn is NULL"},
        {zv_request_upload_query(nullptr), -997, "handle is NULL"},
    };
    std::vector<std::string> expected;
    for (const auto &row : rows) {
        EXPECT_EQ(row.result, row.code) << row.message;
        expected.push_back(row.message);
    }
    EXPECT_EQ(errors(), expected);
    for (const Handle *h : {&a, &m, &d, &l})
        EXPECT_EQ(h->h->transfer, nullptr);
    EXPECT_TRUE(server_->requests().empty());
}

TEST_F(ClientTest, FailedStepsReleaseTheTransferAndKeepTheAttributes)
{
    Handle meta(&inbox_);
    set_meta(meta);
    ASSERT_EQ(unlink(tmp_.file("keys/zuvo.tizen.api.key").c_str()), 0);
    EXPECT_EQ(zv_request_meta_upload(meta.h), ZV_ERROR_KEY_STORAGE);
    EXPECT_EQ(meta.h->transfer->url, nullptr); // emptied

    Handle data(&inbox_); // a file that cannot be opened has size -1, which the engine refuses
    zv_set_attr_upload_url(data.h, ("http://" + server_->host() + "/x").c_str());
    zv_set_attr_file_path(data.h, tmp_.file("missing.mp4").c_str());
    EXPECT_EQ(zv_request_data_upload(data.h), ZV_ERROR_REQUEST_FAIL);
    EXPECT_EQ(data.h->transfer->url, nullptr);
    EXPECT_EQ(errors(), (std::vector<std::string>{"key_storage_get fail",
                                                  "zv_curl_set_file_info fail"}));
    EXPECT_TRUE(server_->requests().empty());

    // The metadata handle again, once the key is back: its attributes were kept.
    ASSERT_EQ(key_storage_set("zuvo.tizen.api.key", API_KEY), 0);
    EXPECT_EQ(send(zv_request_meta_upload, meta).result, 0);
    ASSERT_EQ(server_->requests().size(), 1u);
    EXPECT_NE(server_->requests()[0].body().find(">Clip &amp; co</media:title>"),
              std::string::npos);
}

// --- Metadata upload ---

TEST_F(ClientTest, MetaUploadSendsHeadersAndEntryInOrder)
{
    // What the attributes become in the entry, which ComposeTest checks byte for byte.
    const struct {
        int privacy;
        double latitude, longitude;
        const char *description, *keyword, *location, *permission;
        bool is_private;
        const char *position;
    } cases[] = {
        {0, 0, 0, nullptr, nullptr, nullptr, "allowed", false, nullptr},
        {1, 0, 0, nullptr, nullptr, nullptr, "denied", false, nullptr},
        {2, 0, 0, "A day", "sea, sand", nullptr, "denied", true, nullptr},
        {3, 37.5, 0, nullptr, nullptr, nullptr, nullptr, false, "37.500000 0.000000"},
        {0, -33.8688, 151.2093, nullptr, nullptr, "Busan", "allowed", false,
         "-33.868800 151.209300"},
    };
    for (const auto &c : cases) {
        SCOPED_TRACE("privacy " + std::to_string(c.privacy));
        Handle meta(&inbox_);
        set_meta(meta);
        zv_set_attr_privacy(meta.h, c.privacy);
        zv_set_attr_gps(meta.h, c.latitude, c.longitude);
        if (c.description)
            zv_set_attr_description(meta.h, c.description);
        if (c.keyword)
            zv_set_attr_keyword(meta.h, c.keyword);
        if (c.location)
            zv_set_attr_location(meta.h, c.location);
        const Answer a = send(zv_request_meta_upload, meta);

        const Logged r = server_->requests().back();
        const std::string body = r.body();
        EXPECT_EQ(r.get("method") + " " + r.get("target"),
                  "POST /resumable/feeds/api/users/default/uploads");
        char *entry = zv_plugin_xml_compose_request("Clip &amp; co", c.description, "Film",
                                                    c.keyword, c.location, c.permission,
                                                    c.is_private, c.position);
        EXPECT_EQ(body, entry ? entry : "(null)");
        free(entry);
        const Headers expected = {
            {"Host", server_->host()},
            {"User-Agent", USER_AGENT},
            {"Accept", "*/*"},
            {"Accept-Encoding", "gzip,deflate"},
            {"Content-Type", "application/atom+xml; charset=UTF-8"},
            {"ZvData-Version", "2"},
            {"Authorization", std::string("Bearer ") + TOKEN},
            {"X-ZvData-Key", std::string("key=") + API_KEY},
            {"Content-Length", std::to_string(body.size())},
            {"Slug", "clip.mp4"},
            {"Connection", "Keep-Alive"},
            {"keep-alive", "100"},
        };
        EXPECT_EQ(r.headers, expected);
        EXPECT_EQ(a.result, 0);
        EXPECT_EQ(a.http_code, 201);
        EXPECT_EQ(a.resp_type, ZV_RESP_TYPE_META_UPLOAD);
        EXPECT_EQ(a.value, server_->url("/resumable/uploads/" + r.upload_id));
    }
}

TEST_F(ClientTest, MetaUploadAnswersThatFail)
{
    start_server({"--fault", "kind=meta,action=status,status=400,nth=3"});
    const std::string long_token(600, 't');
    const struct {
        const char *name;
        std::string token, host;
        int result, http_code;
    } cases[] = {
        {"refused token", "wrong", server_->host(), -999, 401},
        {"header line cut at 511", long_token, server_->host(), -999, 401},
        {"status 400", TOKEN, server_->host(), -999, 400},
        {"nobody listening", TOKEN, "127.0.0.1:1", -999, 0},
    };
    for (const auto &c : cases) {
        setenv("ZV_UPLOAD_HOST", c.host.c_str(), 1);
        Handle meta(&inbox_);
        set_meta(meta, c.token.c_str());
        const Answer a = send(zv_request_meta_upload, meta);
        EXPECT_EQ(a.result, c.result) << c.name;
        EXPECT_EQ(a.http_code, c.http_code) << c.name;
        EXPECT_EQ(a.value, std::nullopt) << c.name;
    }
    const auto requests = server_->requests();
    ASSERT_EQ(requests.size(), 3u);
    EXPECT_EQ(requests[1].header("Authorization"), "Bearer " + long_token.substr(0, 511 - 22));
}

// --- Data upload and status query ---

TEST_F(ClientTest, DataUploadCutThenResumedBehindTheStatusQuery)
{
    start_server({"--fault", "kind=data,action=cut,bytes=4096"});
    const std::string url = create_upload();
    const Answer nothing = status_query(url);
    EXPECT_EQ(nothing.result, 0);
    EXPECT_EQ(nothing.http_code, 308);
    EXPECT_EQ(nothing.value, std::nullopt); // no Range header: nothing held
    const Answer cut = data_upload(url, 0, clip_);
    EXPECT_EQ(cut.result, -999);
    EXPECT_EQ(cut.http_code, 0);
    const Answer held = status_query(url);
    EXPECT_EQ(held.result, 0);
    EXPECT_EQ(held.http_code, 308);
    EXPECT_EQ(held.resp_type, ZV_RESP_TYPE_UPLOAD_QUERY);
    ASSERT_EQ(held.value, "4095");
    const std::string file = tmp_.file("clip.unknown"); // no known media type
    ASSERT_EQ(rename(clip_.c_str(), file.c_str()), 0);
    inbox_.percents.clear(); // the worker reports nothing between requests
    const Answer done = data_upload(url, std::stoi(*held.value), file);
    EXPECT_EQ(done.result, 0);
    EXPECT_EQ(done.http_code, 201);
    EXPECT_EQ(done.resp_type, ZV_RESP_TYPE_DATA_UPLOAD);

    std::vector<Logged> queries, puts;
    for (const auto &r : server_->requests())
        if (r.kind != "meta")
            (r.kind == "status" ? queries : puts).push_back(r);
    ASSERT_EQ(queries.size(), 2u);
    ASSERT_EQ(puts.size(), 2u);
    EXPECT_EQ(done.value, " \"" + puts[1].upload_id + "\"");
    EXPECT_EQ(queries[1].get("method") + " " + queries[1].get("body_length"), "PUT 0");
    const Headers query_headers = {
        {"Host", server_->host()},
        {"User-Agent", USER_AGENT},
        {"Accept-Encoding", "gzip,deflate"},
        {"Content-Range", "bytes */*"},
        {"Content-Length", "0"},
    };
    EXPECT_EQ(queries[1].headers, query_headers);
    const Headers first_headers = {
        {"Host", server_->host()},
        {"User-Agent", USER_AGENT},
        {"Accept", "*/*"},
        {"Accept-Encoding", "gzip,deflate"},
        {"Content-Type", "video/mp4"},
        {"Content-Range", "bytes 0-9999/10000"},
        {"Content-Length", "10000"},
        {"Connection", "Keep-Alive"},
        {"keep-alive", "100"},
    };
    EXPECT_EQ(puts[0].headers, first_headers);
    // The server refuses a wrong range and keeps what arrives: the copy shows both.
    const Logged &rest = puts[1];
    EXPECT_EQ(rest.header("Content-Type"), "application/octet-stream");
    EXPECT_EQ(rest.header("Expect"), std::nullopt);
    EXPECT_EQ(rest.header("Transfer-Encoding"), std::nullopt);
    EXPECT_EQ(server_->stored(rest.upload_id), read_file(file));
    std::lock_guard<std::mutex> lock(inbox_.mutex);
    EXPECT_TRUE(std::is_sorted(inbox_.percents.begin(), inbox_.percents.end()));
    EXPECT_EQ(inbox_.percents.back(), 100);
}

TEST_F(ClientTest, DataUploadPastFourGiBGoesOnBehindTheStatusAnswer)
{
    // The server closes the data upload at its headers: none of its 2,000,000,000 bytes move.
    start_server({"--fault", "kind=data,action=cut,bytes=0"});
    const std::string url = create_upload();
    const std::string video = tmp_.file("video.mp4");
    ASSERT_TRUE(zv_test::write_file(video, ""));
    ASSERT_EQ(truncate(video.c_str(), 5000000000LL), 0); // sparse

    // The status answer of a server holding 3,000,000,000 bytes, as the engine hands it over.
    Handle query(&inbox_);
    query.h->resp_type = ZV_RESP_TYPE_UPLOAD_QUERY;
    char header[] = "HTTP/1.1 308 Resume Incomplete\r\nRange: bytes=0-2999999999\r\n\r\n";
    TransferResponse answer = {308, header, nullptr};
    _zv_request_curl_resp_cb(0, &answer, query.h);
    ASSERT_EQ(inbox_.got().back().value, "2999999999");

    data_upload(url, std::stoll(*inbox_.got().back().value), video);
    const Logged put = server_->requests().back();
    EXPECT_EQ(put.header("Content-Range"), "bytes 3000000000-4999999999/5000000000");
    EXPECT_EQ(put.header("Content-Length"), "2000000000");
}

TEST_F(ClientTest, PausedUploadResumesAndFreedUploadNeverAnswers)
{
    start_server({"--fault", "kind=data,action=throttle,rate=8000,times=0"});
    const std::string url = create_upload(), other_url = create_upload();
    auto gone = std::make_unique<Handle>(&inbox_); // freed while the server reads its body
    zv_set_progress_callback_func(gone->h, nullptr); // its progress is dropped
    Handle data(&inbox_);
    for (auto [h, u] : {std::make_pair(gone->h, &other_url), std::make_pair(data.h, &url)}) {
        zv_set_attr_upload_url(h, u->c_str());
        zv_set_attr_file_path(h, clip_.c_str());
        ASSERT_EQ(zv_request_data_upload(h), 0);
    }
    gone.reset();
    ASSERT_TRUE(wait_for([&] {
        std::lock_guard<std::mutex> lock(inbox_.mutex);
        return !inbox_.percents.empty();
    }));
    EXPECT_EQ(zv_request_upload_pause(data.h), 0);
    EXPECT_EQ(zv_request_upload_resume(data.h), 0);
    ASSERT_TRUE(wait_for([&] { return inbox_.got().size() >= 3; }, 60000));
    EXPECT_EQ(inbox_.got().back().http_code, 201);
    EXPECT_EQ(inbox_.got().size(), 3u); // two metadata answers and this one
    const std::string etag = inbox_.got().back().value.value_or("  ");
    EXPECT_EQ(server_->stored(etag.substr(2, etag.size() - 3)), read_file(clip_));
    EXPECT_EQ(zv_request_upload_cancel(data.h), 0);
}

// --- Category document ---

TEST_F(ClientTest, CategoryLabelsInDocumentOrderWithLanguageFallback)
{
    auto labels = [](const char *language) {
        std::vector<std::string> out;
        GList *list = zv_plugin_xml_get_category_list(language);
        for (GList *l = list; l; l = l->next)
            out.push_back(static_cast<char *>(l->data));
        g_list_free_full(list, g_free);
        return out;
    };
    const auto english = labels(nullptr);
    ASSERT_EQ(english.size(), 15u);
    EXPECT_EQ(std::vector<std::string>(english.begin(), english.begin() + 3),
              (std::vector<std::string>{"Film & Animation", "Autos & Vehicles", "Music"}));
    EXPECT_EQ(labels("xx"), english); // no document in that language
    EXPECT_EQ(labels("ko").at(2), "음악");

    std::vector<std::string> targets;
    for (const auto &r : server_->requests())
        targets.push_back(r.get("method") + " " + r.get("target"));
    const std::string doc = "GET /schemas/2007/categories.cat";
    EXPECT_EQ(targets, (std::vector<std::string>{doc, doc + "?hl=xx", doc, doc + "?hl=ko"}));

    // Documents the server is told to answer with: only labels of category elements count.
    const std::string labelled =
        "<?xml version=\"1.0\"?>\n<app:categories xmlns:app=\"http://www.w3.org/2007/app\" "
        "xmlns:atom=\"http://www.w3.org/2005/Atom\">\n"
        "  <atom:category term=\"Film\" label=\"Film\"/>\n"
        "  <!-- a comment -->\n"
        "  <atom:category term=\"Untitled\"/>\n"
        "  <atom:term label=\"Not a category\"/>\n"
        "  <category scheme=\"x\" label=\"Music &amp; Dance\" term=\"Music\"/>\n"
        "  <atom:category label=\"Sports\"/>\n"
        "</app:categories>\n";
    const struct {
        const char *status, *doc;
        std::vector<std::string> expected;
    } cases[] = {
        {"200", labelled.c_str(), {"Film", "Music & Dance", "Sports"}},
        {"200", "<feed><category label=\"Film\"/></feed>", {}}, // another root
        {"200", "Film, Music", {}},                              // not XML
        {"404", "", {}},
    };
    for (const auto &c : cases) {
        ASSERT_TRUE(server_->clear_faults());
        gchar *body = g_uri_escape_string(c.doc, nullptr, false);
        ASSERT_TRUE(server_->add_fault(std::string("kind=category&action=status&times=0&status=") +
                                       c.status + "&body=" + body));
        g_free(body);
        EXPECT_EQ(labels("de"), c.expected) << c.doc;
    }
}

// --- Login and token refresh (https) ---

class AccountTest : public ClientTest {
protected:
    std::vector<std::string> server_args() override
    {
        const std::string cert = tmp_.file("cert.pem"), key = tmp_.file("key.pem");
        zv_test::run_program({"/usr/bin/openssl", "req", "-x509", "-newkey", "ec", "-pkeyopt",
                              "ec_paramgen_curve:prime256v1", "-nodes", "-keyout", key, "-out",
                              cert, "-days", "2", "-subj", "/CN=127.0.0.1", "-addext",
                              "subjectAltName=IP:127.0.0.1"});
        return {"--tls-port",     "0",          "--tls-cert",      cert,       "--tls-key", key,
                "--issued-token", ISSUED_TOKEN, "--refresh-token", "refresh-1"};
    }
    void SetUp() override
    {
        ClientTest::SetUp();
        setenv("ZV_ACCOUNT_HOST", server_->tls_host().c_str(), 1);
        setenv("ZV_TOKEN_HOST", server_->tls_host().c_str(), 1);
        ASSERT_EQ(key_storage_set("zuvo.tizen.client.id", "client-1"), 0);
        ASSERT_EQ(key_storage_set("zuvo.tizen.client.secret", "secret-1"), 0);
    }
    // Issues a login (two strings) or a token refresh (one) and waits for its answer.
    Answer account(const std::string &first, const char *pwd = nullptr)
    {
        Handle h(&inbox_);
        if (pwd) {
            zv_set_attr_user_id(h.h, first.c_str());
            zv_set_attr_user_pwd(h.h, pwd);
        } else {
            zv_set_attr_refresh_token(h.h, first.c_str());
        }
        return send(pwd ? zv_request_login : zv_request_get_token, h);
    }
};

TEST_F(AccountTest, LoginAndTokenRefreshPostTheirForms)
{
    const Answer login = account("me@example.org", "p&w=d");
    EXPECT_EQ(login.result, 0);
    EXPECT_EQ(login.resp_type, ZV_RESP_TYPE_LOGIN);
    EXPECT_EQ(login.value, ISSUED_TOKEN);
    account(std::string(5000, 'u'), "p");
    const Answer refresh = account("refresh-1");
    EXPECT_EQ(refresh.result, 0);
    EXPECT_EQ(refresh.resp_type, ZV_RESP_TYPE_GET_TOKEN);
    EXPECT_EQ(refresh.value, ISSUED_TOKEN);
    const Answer cut = account(std::string(1100, 'r')); // loses its grant_type: refused
    EXPECT_EQ(cut.result, -999);
    EXPECT_EQ(cut.http_code, 400);
    EXPECT_EQ(cut.value, std::nullopt);

    const auto r = server_->requests();
    ASSERT_EQ(r.size(), 4u);
    EXPECT_EQ(r[0].get("scheme") + " " + r[0].get("method") + " " + r[0].get("target"),
              "https POST /accounts/ClientLogin");
    EXPECT_EQ(r[0].body(), "Email=me@example.org&Passwd=p&w=d&service=zuvo&source=Halvane");
    EXPECT_EQ(r[0].header("Content-Type"), "application/x-www-form-urlencoded");
    EXPECT_EQ(r[0].header("User-Agent"), USER_AGENT);
    EXPECT_EQ(r[1].body(), "Email=" + std::string(4089, 'u')); // cut at 4095
    EXPECT_EQ(r[2].get("scheme") + " " + r[2].get("method") + " " + r[2].get("target"),
              "https POST /o/oauth2/token");
    const std::string prefix = "client_id=client-1&client_secret=secret-1&refresh_token=";
    EXPECT_EQ(r[2].body(), prefix + "refresh-1&grant_type=refresh_token");
    EXPECT_EQ(r[2].header("User-Agent"), std::nullopt);
    EXPECT_EQ(r[3].body(), prefix + std::string(1023 - prefix.size(), 'r'));
    // The engine's verbose log shows the forms with their credentials masked.
    const std::string log = g_log.since_mark();
    EXPECT_NE(log.find("Email=me@example.org&Passwd=****&w=d&service=zuvo"), std::string::npos);
    EXPECT_NE(log.find("client_id=client-1&client_secret=****&refresh_token=****&grant_type"),
              std::string::npos);
    for (const char *secret : {"secret-1", "refresh-1", "Passwd=p"})
        EXPECT_EQ(log.find(secret), std::string::npos) << secret;

    // Without the client's keys a refresh queues nothing.
    g_log.mark();
    Handle h(&inbox_);
    zv_set_attr_refresh_token(h.h, "refresh-1");
    for (const char *missing : {"zuvo.tizen.client.secret", "zuvo.tizen.client.id"}) {
        ASSERT_EQ(unlink(tmp_.file(std::string("keys/") + missing).c_str()), 0);
        EXPECT_EQ(zv_request_get_token(h.h), ZV_ERROR_KEY_STORAGE) << missing;
    }
    EXPECT_EQ(errors(), (std::vector<std::string>{"key_storage_get fail", "key_storage_get fail"}));
    EXPECT_EQ(server_->requests().size(), 4u);
}

} // namespace
