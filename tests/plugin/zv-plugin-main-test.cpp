// The service client against zuvo-devserver on loopback: what each request puts on the wire
// (read back from the server's request log), what reaches the response callback, and the
// refusals that happen before anything is sent. Grouped by request kind.
#include <gtest/gtest.h>
#include <key_storage.h>
#include <unistd.h>

#include <atomic>
#include <memory>
#include <mutex>
#include <optional>
#include <regex>
#include <string>
#include <tuple>
#include <vector>

#include "zv-plugin-main.h"
#include "zv-plugin-xml.h"
#include "zv-test-server.h"

namespace
{

const char TOKEN[] = "access-token-1";
const char API_KEY[] = "api-key-1";
const char ISSUED_TOKEN[] = "issued-token-1";
const char USER_AGENT[] = "Mozilla/5.0 (Linux; Tizen 2.4; HALVANE QX-M410) AppleWebKit/537.3 "
                          "(KHTML, like Gecko) HalvaneBrowser/1.1 Mobile Safari/537.3";
// Header lines as head() writes them: the lines that open and close the uploads' headers.
const std::string OPENING =
    "Host: HOST\nUser-Agent: UA\nAccept: */*\nAccept-Encoding: gzip,deflate\n";
const std::string KEEP_ALIVE = "Connection: Keep-Alive\nkeep-alive: 100\n";

zv_test::LogFile g_log; // before the first log line opens the file

// What reaches a response callback: result, http_code, resp_type and value.
using Answer = std::tuple<int, int, int, std::optional<std::string>>;

// What reaches the callbacks of the handles made with it (worker thread).
struct Inbox {
    std::mutex mutex;
    std::vector<Answer> answers;
    std::atomic<int> percent{-1}; // the last one reported

    std::vector<Answer> got()
    {
        std::lock_guard<std::mutex> lock(mutex);
        return answers;
    }
};

// A handle whose answers and progress go to `inbox` (none: it must never send).
struct Handle {
    ServiceRequest *h = zv_request_new();
    explicit Handle(Inbox *inbox = nullptr)
    {
        zv_set_callback_func(h, [](int result, ServiceResponse *r, void *user_data) {
            auto *inbox = static_cast<Inbox *>(user_data);
            std::lock_guard<std::mutex> lock(inbox->mutex);
            inbox->answers.emplace_back(result, r->http_code, r->resp_type,
                                        r->value ? std::optional<std::string>(r->value)
                                                 : std::nullopt);
        });
        zv_set_progress_callback_func(h, [](ServiceRequest *, int percent, void *user_data) {
            static_cast<Inbox *>(user_data)->percent = percent;
        });
        zv_set_user_data(h, inbox);
    }
    ~Handle() { zv_request_free(h); }
};

class ClientTest : public ::testing::Test
{
  protected:
    // The server takes the token and the API key of the tests, and serves the account
    // requests on https.
    void SetUp() override
    {
        g_log.mark();
        ASSERT_TRUE(zv_init_service());
        const std::string cert = tls_dir().file("cert.pem"), key = tls_dir().file("key.pem");
        ASSERT_TRUE(server_.start(tmp_.file("server"),
                                  {"--token", TOKEN, "--api-key", API_KEY, "--tls-port", "0",
                                   "--tls-cert", cert, "--tls-key", key, "--issued-token",
                                   ISSUED_TOKEN, "--refresh-token", "refresh-1"}));
        for (const auto &kv : server_.env())
            setenv(kv.first.c_str(), kv.second.c_str(), 1);
        setenv("ZV_ACCOUNT_HOST", server_.tls_host().c_str(), 1);
        setenv("ZV_TOKEN_HOST", server_.tls_host().c_str(), 1);
        for (auto [name, value] : {std::make_pair("zuvo.tizen.api.key", API_KEY),
                                   {"zuvo.tizen.client.id", "client-1"},
                                   {"zuvo.tizen.client.secret", "secret-1"}})
            ASSERT_EQ(key_storage_set(name, value), 0);
        std::string bytes(10000, '\0');
        for (size_t i = 0; i < bytes.size(); i++)
            bytes[i] = (char)(i * 7 + i / 256);
        ASSERT_TRUE(zv_test::write_file(clip_, bytes));
    }
    void TearDown() override { zv_finalize_service(); }

    // The server's certificate and key for 127.0.0.1, made once for every test of the program.
    static const zv_test::TempDir &tls_dir()
    {
        static const zv_test::TempDir dir(false);
        static const int made = zv_test::run_program(
            {"/usr/bin/openssl", "req", "-x509", "-newkey", "ec", "-pkeyopt",
             "ec_paramgen_curve:prime256v1", "-nodes", "-keyout", dir.file("key.pem"), "-out",
             dir.file("cert.pem"), "-days", "2", "-subj", "/CN=127.0.0.1", "-addext",
             "subjectAltName=IP:127.0.0.1"});
        EXPECT_EQ(made, 0) << "openssl could not make the test certificate";
        return dir;
    }

    // Messages the client (not the engine) logged at error level since the test began.
    std::vector<std::string> errors() const
    {
        static const std::regex error("E/zuvo-plugin\\(.*: zv-plugin-main\\.cpp: .*"
                                      "\033\\[31m\\[TID:\\d+\\] (.*)\033\\[0m");
        const std::string text = g_log.since_mark();
        std::vector<std::string> out;
        for (std::sregex_iterator m(text.begin(), text.end(), error), end; m != end; ++m)
            out.push_back((*m)[1]);
        return out;
    }
    // The header lines of a logged request, "Name: value" each, with the server's address
    // written HOST and the user agent UA.
    std::string head(const zv_test::Logged &r) const
    {
        std::string out, host = server_.host();
        for (const auto &[name, v] : r.headers)
            out += name + ": " + (v == host ? "HOST" : v == USER_AGENT ? "UA" : v) + "\n";
        return out;
    }

    // Issues the request and waits for its answer.
    Answer send(int (*request)(ServiceRequest *), const Handle &handle)
    {
        const size_t before = inbox_.got().size();
        EXPECT_EQ(request(handle.h), 0);
        EXPECT_TRUE(zv_test::wait_for([&] { return inbox_.got().size() > before; }, 60000));
        return inbox_.got().size() > before ? inbox_.got().back() : Answer{1, 1, 1, std::nullopt};
    }
    void set_meta(const Handle &meta, const char *token = TOKEN)
    {
        zv_set_attr_token(meta.h, token);
        zv_set_attr_title(meta.h, "Clip &amp; co <3"); // an entity, and markup to escape
        zv_set_attr_category(meta.h, "Film");
        zv_set_attr_file_path(meta.h, clip_.c_str());
    }
    // A new upload on the server: its address.
    std::string create_upload()
    {
        Handle meta(&inbox_);
        set_meta(meta);
        return std::get<3>(send(zv_request_meta_upload, meta)).value_or("");
    }
    // Issues a data upload of `path` from `offset` on or, without a path, a status query of
    // the upload at `url`, and waits for its answer.
    Answer upload_step(const std::string &url, const std::string &path = "", int64_t offset = 0)
    {
        Handle h(&inbox_);
        zv_set_attr_upload_url(h.h, url.c_str());
        zv_set_attr_file_offset(h.h, offset);
        zv_set_attr_file_path(h.h, path.c_str());
        return send(path.empty() ? zv_request_upload_query : zv_request_data_upload, h);
    }

    // Issues a login (with a password) or a token refresh (without) and waits for its answer;
    // the attributes the other request takes are set too, and never sent.
    Answer account(const std::string &first, const char *pwd = nullptr)
    {
        Handle h(&inbox_);
        zv_set_attr_user_id(h.h, first.c_str());
        zv_set_attr_user_pwd(h.h, pwd ? pwd : "");
        zv_set_attr_refresh_token(h.h, first.c_str());
        return send(pwd ? zv_request_login : zv_request_get_token, h);
    }

    zv_test::TempDir tmp_;
    zv_test::DevServer server_;
    const std::string clip_ = tmp_.file("clip.mp4");
    Inbox inbox_;
};

// --- Service lifetime, attributes and refusals ---

TEST_F(ClientTest, RefusalsSendNothingSayWhyAndKeepTheHandlesUsable)
{
    // A second stop and a second start are harmless, and logged.
    zv_finalize_service();
    zv_finalize_service();
    EXPECT_TRUE(zv_init_service());
    EXPECT_TRUE(zv_init_service());
    EXPECT_TRUE(g_log.logged("] Not yet start servie\n"));
    EXPECT_TRUE(g_log.logged("] Already init servie\n"));

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
        {zv_set_callback_func(nullptr, nullptr), -997, "handle is NULL"},
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
    for (const Handle *h : {&a, &m, &d, &l})
        EXPECT_EQ(h->h->transfer, nullptr);

    // Steps that fail once the values are there: a key missing from the key storage, and a
    // file that cannot be opened (size -1, which the engine refuses).
    Handle meta(&inbox_), data(&inbox_), refresh(&inbox_);
    set_meta(meta);
    ASSERT_EQ(unlink(tmp_.file("keys/zuvo.tizen.api.key").c_str()), 0);
    EXPECT_EQ(zv_request_meta_upload(meta.h), ZV_ERROR_KEY_STORAGE);
    zv_set_attr_upload_url(data.h, ("http://" + server_.host() + "/x").c_str());
    zv_set_attr_file_path(data.h, tmp_.file("missing.mp4").c_str());
    EXPECT_EQ(zv_request_data_upload(data.h), ZV_ERROR_REQUEST_FAIL);
    zv_set_attr_refresh_token(refresh.h, "refresh-1");
    for (const char *missing : {"zuvo.tizen.client.secret", "zuvo.tizen.client.id"}) {
        ASSERT_EQ(unlink(tmp_.file(std::string("keys/") + missing).c_str()), 0);
        EXPECT_EQ(zv_request_get_token(refresh.h), ZV_ERROR_KEY_STORAGE) << missing;
    }
    expected.insert(expected.end(), {"key_storage_get fail", "zv_curl_set_file_info fail",
                                     "key_storage_get fail", "key_storage_get fail"});
    EXPECT_EQ(errors(), expected);
    EXPECT_TRUE(server_.requests().empty());

    // The metadata handle again, once its key is back: its attributes were kept (a lost one
    // would be refused).
    ASSERT_EQ(key_storage_set("zuvo.tizen.api.key", API_KEY), 0);
    EXPECT_EQ(std::get<0>(send(zv_request_meta_upload, meta)), 0);
    EXPECT_EQ(server_.requests().size(), 1u);
}

// --- Metadata upload ---

TEST_F(ClientTest, MetaUploadSendsHeadersAndEntryInOrderAndFailsOnOtherAnswers)
{
    // The entry byte for byte: what each attribute becomes, in document order.
    const std::string title = "    <media:title type=\"plain\">Clip &amp; co &lt;3</media:title>\n",
                      category = "    <media:category scheme=\"" +
                                 server_.url("/schemas/2007/categories.cat") +
                                 "\">Film</media:category>\n",
                      geo = " xmlns:georss=\"http://www.georss.org/georss\""
                            " xmlns:gml=\"http://www.opengis.net/gml\"";
    auto access = [](const std::string &permission) {
        return "  <zv:accessControl action=\"list\" permission=\"" + permission + "\"/>\n";
    };
    auto where = [](const std::string &position) {
        return "  <georss:where>\n    <gml:Point>\n      <gml:pos>" + position +
               "</gml:pos>\n    </gml:Point>\n  </georss:where>\n";
    };
    const struct {
        int privacy;
        double latitude, longitude;
        const char *description, *keyword, *location;
        std::string namespaces, group, rest; // further namespaces; the media group; what follows
    } cases[] = {
        {1, 0, 0, nullptr, nullptr, nullptr, "", title + category, access("denied")},
        {2, 0, 0, "A day", "sea, sand", nullptr, "",
         title + "    <media:description type=\"plain\">A day</media:description>\n" + category +
             "    <media:keywords>sea, sand</media:keywords>\n    <zv:private/>\n",
         access("denied")},
        {3, 37.5, 0, nullptr, nullptr, nullptr, geo, title + category, where("37.500000 0.000000")},
        {0, -33.8688, 151.2093, nullptr, nullptr, "Busan", geo, title + category,
         "  <zv:location>Busan</zv:location>\n" + access("allowed") +
             where("-33.868800 151.209300")},
    };
    for (const auto &c : cases) {
        SCOPED_TRACE("privacy " + std::to_string(c.privacy));
        Handle meta(&inbox_);
        set_meta(meta);
        zv_set_attr_privacy(meta.h, c.privacy);
        zv_set_attr_gps(meta.h, c.latitude, c.longitude);
        zv_set_attr_description(meta.h, c.description); // a NULL is refused: none
        zv_set_attr_keyword(meta.h, c.keyword);
        zv_set_attr_location(meta.h, c.location);
        const Answer a = send(zv_request_meta_upload, meta);

        const auto r = server_.requests().back();
        const std::string body = r.body();
        EXPECT_EQ(r.get("method") + " " + r.get("target"),
                  "POST /resumable/feeds/api/users/default/uploads");
        EXPECT_EQ(body, "<?xml version=\"1.0\"?>\r\n<entry xmlns=\"http://www.w3.org/2005/Atom\""
                        " xmlns:media=\"http://search.yahoo.com/mrss/\" xmlns:zv=\"" +
                            server_.url("/schemas/2007") + "\"" + c.namespaces +
                            ">\n  <media:group>\n" + c.group + "  </media:group>\n" + c.rest +
                            "</entry>");
        EXPECT_EQ(head(r), OPENING +
                               "Content-Type: application/atom+xml; charset=UTF-8\n"
                               "ZvData-Version: 2\nAuthorization: Bearer access-token-1\n"
                               "X-ZvData-Key: key=api-key-1\nContent-Length: " +
                               std::to_string(body.size()) + "\nSlug: clip.mp4\n" + KEEP_ALIVE);
        EXPECT_EQ(a, (Answer{0, 201, ZV_RESP_TYPE_META_UPLOAD,
                             server_.url("/resumable/uploads/" + r.upload_id)}));
    }

    // Any status but 200, 201 and 308 fails, as does no answer (the token refresh shows a 400).
    const std::string long_token(600, 't');
    for (const std::string &host : {server_.host(), std::string("127.0.0.1:1")}) {
        setenv("ZV_UPLOAD_HOST", host.c_str(), 1); // the second: nobody listening
        Handle meta(&inbox_);
        set_meta(meta, long_token.c_str()); // refused
        EXPECT_EQ(send(zv_request_meta_upload, meta),
                  (Answer{ZV_ERROR_HTTP, host == server_.host() ? 401 : 0, ZV_RESP_TYPE_META_UPLOAD,
                          std::nullopt}));
    }
    // The header line is cut at 511 characters.
    EXPECT_EQ(server_.requests().back().header("Authorization"),
              "Bearer " + long_token.substr(0, 511 - 22));
}

// --- Data upload and status query ---

// The server cuts the first data upload after 4096 bytes, and the third at its headers.
TEST_F(ClientTest, DataUploadCutThenResumedBehindTheStatusQuery)
{
    ASSERT_TRUE(server_.add_fault("kind=data&action=cut&bytes=4096"));
    ASSERT_TRUE(server_.add_fault("kind=data&action=cut&bytes=0&nth=3"));
    const std::string url = create_upload();
    const int query = ZV_RESP_TYPE_UPLOAD_QUERY, data = ZV_RESP_TYPE_DATA_UPLOAD;
    // No Range header: nothing held.
    EXPECT_EQ(upload_step(url), (Answer{0, 308, query, std::nullopt}));
    EXPECT_EQ(upload_step(url, clip_), (Answer{ZV_ERROR_HTTP, 0, data, std::nullopt}));
    ASSERT_EQ(upload_step(url), (Answer{0, 308, query, "4095"}));
    const std::string file = tmp_.file("clip.unknown"); // no known media type
    ASSERT_EQ(rename(clip_.c_str(), file.c_str()), 0);
    const Answer done = upload_step(url, file, 4095);

    const std::string id = server_.upload_of_url(url).id;
    const auto r = server_.requests_of(id); // metadata, query, cut, query, the rest
    ASSERT_EQ(r.size(), 5u);
    EXPECT_EQ(done, (Answer{0, 201, data, " \"" + id + "\""}));
    EXPECT_EQ(head(r[3]), "Host: HOST\nUser-Agent: UA\nAccept-Encoding: gzip,deflate\n"
                          "Content-Range: bytes */*\nContent-Length: 0\n");
    // The header lines of a data upload.
    auto put = [](const std::string &type, const std::string &range, const std::string &length) {
        return OPENING + "Content-Type: " + type + "\nContent-Range: bytes " + range +
               "\nContent-Length: " + length + "\n" + KEEP_ALIVE;
    };
    EXPECT_EQ(head(r[2]), put("video/mp4", "0-9999/10000", "10000"));
    // The server refuses a wrong range: the answer shows the rest was taken.
    EXPECT_EQ(head(r[4]), put("application/octet-stream", "4096-9999/10000", "5904"));

    // Past 4 GiB: none of the 2,000,000,000 bytes move, the headers tell.
    const std::string video = tmp_.file("video.mp4");
    ASSERT_TRUE(zv_test::write_file(video, ""));
    ASSERT_EQ(truncate(video.c_str(), 5000000000LL), 0); // sparse
    upload_step(create_upload(), video, 2999999999LL);
    EXPECT_EQ(head(server_.requests().back()),
              put("video/mp4", "3000000000-4999999999/5000000000", "2000000000"));
}

TEST_F(ClientTest, PausedUploadResumesAndFreedUploadNeverAnswers)
{
    ASSERT_TRUE(server_.add_fault("kind=data&action=throttle&rate=8000&times=0"));
    const std::string url = create_upload(), other_url = create_upload();
    auto gone = std::make_unique<Handle>(&inbox_);   // freed while the server reads its body
    zv_set_progress_callback_func(gone->h, nullptr); // its progress is dropped
    Handle data(&inbox_);
    for (auto [h, u] : {std::make_pair(gone->h, &other_url), std::make_pair(data.h, &url)}) {
        zv_set_attr_upload_url(h, u->c_str());
        zv_set_attr_file_path(h, clip_.c_str());
        ASSERT_EQ(zv_request_data_upload(h), 0);
    }
    // Its first read is dropped, and logged, before it goes.
    ASSERT_TRUE(zv_test::wait_for([] { return g_log.logged("progress cb func is NULL"); }));
    gone.reset();
    ASSERT_TRUE(zv_test::wait_for([&] { return inbox_.percent >= 0; }));
    EXPECT_EQ(zv_request_upload_pause(data.h), 0);
    EXPECT_EQ(zv_request_upload_resume(data.h), 0);
    ASSERT_TRUE(zv_test::wait_for([&] { return inbox_.got().size() >= 3; }, 60000));
    EXPECT_EQ(inbox_.got().size(), 3u); // two metadata answers and this one
    EXPECT_EQ(inbox_.percent, 100);
    const std::string id = server_.upload_of_url(url).id;
    EXPECT_EQ(inbox_.got().back(), (Answer{0, 201, ZV_RESP_TYPE_DATA_UPLOAD, " \"" + id + "\""}));
    EXPECT_EQ(server_.stored(id), zv_test::read_file(clip_));
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
    EXPECT_EQ(english[0], "Film & Animation");
    EXPECT_EQ(labels("xx"), english); // no document in that language: the one without
    EXPECT_EQ(labels("ko").at(2), "음악");

    // Documents the server is told to answer with: only labels of category elements count.
    const std::string labelled =
        "<?xml version=\"1.0\"?>\n<app:categories xmlns:app=\"http://www.w3.org/2007/app\" "
        "xmlns:atom=\"http://www.w3.org/2005/Atom\">\n"
        "  <atom:category term=\"Film\" label=\"Film\"/>\n  <!-- a comment -->\n"
        "  <atom:category term=\"Untitled\"/>\n  <atom:term label=\"Not a category\"/>\n"
        "  <category scheme=\"x\" label=\"Music &amp; Dance\" term=\"Music\"/>\n"
        "  <atom:category label=\"Sports\"/>\n</app:categories>\n";
    const struct {
        const char *status, *doc;
        std::vector<std::string> expected;
    } cases[] = {
        {"200", labelled.c_str(), {"Film", "Music & Dance", "Sports"}},
        {"200", "<feed><category label=\"Film\"/></feed>", {}}, // another root
        {"200", "Film, Music", {}},                             // not XML
    };
    for (const auto &c : cases) {
        ASSERT_TRUE(server_.clear_faults());
        gchar *body = g_uri_escape_string(c.doc, nullptr, false);
        ASSERT_TRUE(server_.add_fault(std::string("kind=category&action=status&times=0&status=") +
                                      c.status + "&body=" + body));
        g_free(body);
        EXPECT_EQ(labels("de"), c.expected) << c.doc;
    }
}

// --- Login and token refresh (https) ---

TEST_F(ClientTest, LoginAndTokenRefreshPostTheirForms)
{
    const int login = ZV_RESP_TYPE_LOGIN, refresh = ZV_RESP_TYPE_GET_TOKEN;
    EXPECT_EQ(account("me@example.org", "p&w=d"), (Answer{0, 200, login, ISSUED_TOKEN}));
    account(std::string(5000, 'u'), "p");
    EXPECT_EQ(account("refresh-1"), (Answer{0, 200, refresh, ISSUED_TOKEN}));
    // A token too long for the form loses its grant_type: refused.
    EXPECT_EQ(account(std::string(1100, 'r')), (Answer{ZV_ERROR_HTTP, 400, refresh, std::nullopt}));

    const auto r = server_.requests();
    ASSERT_EQ(r.size(), 4u);
    EXPECT_EQ(r[0].get("scheme") + " " + r[0].get("target"), "https /accounts/ClientLogin");
    EXPECT_EQ(r[0].body(), "Email=me@example.org&Passwd=p&w=d&service=zuvo&source=Halvane");
    EXPECT_EQ(r[0].header("Content-Type"), "application/x-www-form-urlencoded");
    EXPECT_EQ(r[0].header("User-Agent"), USER_AGENT);
    EXPECT_EQ(r[1].body(), "Email=" + std::string(4089, 'u')); // cut at 4095
    EXPECT_EQ(r[2].get("scheme") + " " + r[2].get("target"), "https /o/oauth2/token");
    const std::string prefix = "client_id=client-1&client_secret=secret-1&refresh_token=";
    EXPECT_EQ(r[2].body(), prefix + "refresh-1&grant_type=refresh_token");
    EXPECT_EQ(r[2].header("User-Agent"), std::nullopt);
    EXPECT_EQ(r[3].body(), prefix + std::string(1023 - prefix.size(), 'r'));
    // The engine's verbose log shows the forms with their credentials masked.
    EXPECT_TRUE(g_log.logged("Email=me@example.org&Passwd=****&w=d&service=zuvo"));
    EXPECT_TRUE(g_log.logged("client_id=client-1&client_secret=****&refresh_token=****&grant"));
    for (const char *secret : {"secret-1", "refresh-1", "Passwd=p"})
        EXPECT_FALSE(g_log.logged(secret)) << secret;
}

} // namespace
