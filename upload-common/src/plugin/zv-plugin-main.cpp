// The service client: request handles with their attributes, the requests of the video
// service and of its account service built as transfers of the transfer engine, and the
// dispatch of the engine's answers and progress to the caller.
//
// Threads: everything but the two dispatch functions runs on the main loop; the dispatch
// functions run on the engine's worker thread with the engine lock held. The process-wide
// state below is touched on the main loop only.
#include "zv-plugin-main.h"

#include <glib.h>
#include <inttypes.h>
#include <key_storage.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>

#include <memory>

#include "zv-log.h"
#include "zv-plugin-util.h"
#include "zv-plugin-xml.h"

namespace {

const char DEFAULT_UPLOAD_HOST[] = "uploads.zuvo.example";
const char DEFAULT_ACCOUNT_HOST[] = "accounts.zuvo.example";
const char DEFAULT_TOKEN_HOST[] = "oauth2.zuvo.example";

const char API_KEY_NAME[] = "zuvo.tizen.api.key";
const char CLIENT_ID_NAME[] = "zuvo.tizen.client.id";
const char CLIENT_SECRET_NAME[] = "zuvo.tizen.client.secret";

const char DEFAULT_MEDIA_TYPE[] = "application/octet-stream";

// Working buffer of one header line; longer lines are cut at 511 characters.
constexpr size_t HEADER_BUF_SIZE = 512;
constexpr size_t POSITION_BUF_SIZE = 512;
constexpr size_t LOGIN_BODY_SIZE = 4096;
constexpr size_t TOKEN_BODY_SIZE = 1024;
constexpr int KEEP_ALIVE_SECONDS = 100;

struct ClientState {
    bool service_started = false;
    char *ip = nullptr;
    char *proxy = nullptr;
};
ClientState g_client;

struct GFree {
    void operator()(void *p) const { g_free(p); }
};
using GText = std::unique_ptr<char, GFree>;

struct Free {
    void operator()(void *p) const { free(p); }
};
using CText = std::unique_ptr<char, Free>;

// A value read from key storage: wiped before it is released.
struct SecretFree {
    void operator()(char *p) const
    {
        explicit_bzero(p, strlen(p));
        free(p);
    }
};
using Secret = std::unique_ptr<char, SecretFree>;

// Replaces an owned text field with a copy of `value`.
void replace_text(char **field, const char *value)
{
    g_free(*field);
    *field = g_strdup(value);
}

// "scheme://" + host[:port] from the environment (or the default) + path.
GText service_address(const char *scheme, const char *env_name, const char *default_host,
                      const char *path)
{
    const char *host = getenv(env_name);
    if (!host || !*host)
        host = default_host;
    return GText(g_strdup_printf("%s://%s%s", scheme, host, path));
}

// A key of key storage, or NULL when it cannot be read or is empty.
Secret read_key(const char *name)
{
    char *value = nullptr;
    const int rc = key_storage_get(name, &value);
    Secret secret(value);
    if (rc != 0 || !value || !*value)
        return Secret();
    return secret;
}

// The status test of every answer: 200, 201 and 308 pass.
bool _zv_check_http_resp_val(long http_code)
{
    ZV_LOG_ENTER();
    return http_code == 200 || http_code == 201 || http_code == 308;
}

GText user_agent_text()
{
    return GText(g_strdup_printf(
        "Mozilla/5.0 (Linux; %s; %s) AppleWebKit/%s (KHTML, like Gecko) %s/%s Mobile Safari/%s",
        "Tizen 2.4", "HALVANE QX-M410", "537.3", "HalvaneBrowser", "1.1", "537.3"));
}

} // namespace

// True when the engine call succeeded; otherwise logs "<call> fail" in the caller's name.
#define CURL_OK(fn, ...)                                                                           \
    ((fn(__VA_ARGS__)) == ZV_CURL_ERROR_NONE || (ZV_LOGE("%s fail", #fn), false))

// Formats one header line into `buf` (cut at 511 characters) and adds it to the transfer.
#define CURL_HEADER(item, buf, ...)                                                                \
    (snprintf(buf, HEADER_BUF_SIZE, __VA_ARGS__), CURL_OK(zv_curl_set_header, item, buf))

// Hands the user agent (formatted by user_agent_text) to the transfer, which keeps its own copy.
#define CURL_USER_AGENT(item, agent)                                                               \
    (((agent) || (ZV_LOGE("szUserAgent value is NULL"), false)) &&                                 \
     CURL_OK(zv_curl_set_user_agent, item, (agent).get()))

bool zv_init_service()
{
    ZV_LOG_ENTER();
    if (g_client.service_started) {
        ZV_LOGI("Already init servie");
        return true;
    }
    if (zv_curl_init_service() != ZV_CURL_ERROR_NONE) {
        ZV_LOGE("ERR: thread init fail");
        return false;
    }
    g_client.service_started = true;
    return true;
}

void zv_finalize_service()
{
    ZV_LOG_ENTER();
    if (!g_client.service_started) {
        ZV_LOGI("Not yet start servie");
        return;
    }
    zv_curl_finalize_service();
    g_free(g_client.ip);
    g_free(g_client.proxy);
    g_client.ip = nullptr;
    g_client.proxy = nullptr;
    g_client.service_started = false;
}

void zv_set_netwrok_info(const char *ip, const char *proxy)
{
    ZV_LOG_ENTER();
    replace_text(&g_client.ip, ip);
    replace_text(&g_client.proxy, proxy);
}

ServiceRequest *zv_request_new()
{
    ZV_LOG_ENTER();
    auto *zv_handle = static_cast<ServiceRequest *>(calloc(1, sizeof(ServiceRequest)));
    g_assert(zv_handle);
    return zv_handle;
}

int zv_request_free(ServiceRequest *zv_handle)
{
    ZV_LOG_ENTER();
    if (!zv_handle) {
        ZV_LOGE("handle data is NULL");
        return ZV_ERROR_INVALID_HANDLE;
    }
    // Cancels the transfer in the engine (detached under the engine lock, so no callback of
    // it runs once this returns), empties it and returns its record.
    zv_curl_delete(&zv_handle->transfer);
    zv_handle->resp_cb = nullptr;
    zv_handle->progress_cb = nullptr;
    char **texts[] = {&zv_handle->user_id,     &zv_handle->user_pwd,   &zv_handle->title,
                      &zv_handle->description, &zv_handle->category,   &zv_handle->keyword,
                      &zv_handle->file_path,   &zv_handle->region,     &zv_handle->location,
                      &zv_handle->token,       &zv_handle->upload_url, &zv_handle->refresh_token};
    for (char **text : texts) {
        g_free(*text);
        *text = nullptr;
    }
    free(zv_handle);
    return ZV_ERROR_NONE;
}

int zv_set_callback_func(ServiceRequest *zv_handle, ServiceRespCb resp_cb)
{
    ZV_LOG_ENTER();
    if (!zv_handle) {
        ZV_LOGE("handle is NULL");
        return ZV_ERROR_INVALID_HANDLE;
    }
    zv_handle->resp_cb = resp_cb;
    return ZV_ERROR_NONE;
}

int zv_set_progress_callback_func(ServiceRequest *zv_handle, ServiceProgressCb progress_cb)
{
    ZV_LOG_ENTER();
    if (!zv_handle) {
        ZV_LOGE("handle is NULL");
        return ZV_ERROR_INVALID_HANDLE;
    }
    zv_handle->progress_cb = progress_cb;
    return ZV_ERROR_NONE;
}

int zv_set_user_data(ServiceRequest *zv_handle, void *user_data)
{
    ZV_LOG_ENTER();
    if (!zv_handle) {
        ZV_LOGE("handle is NULL");
        return ZV_ERROR_INVALID_HANDLE;
    }
    zv_handle->user_data = user_data;
    return ZV_ERROR_NONE;
}

// The text setters share one shape: handle check, value check with the setter's own code and
// message, then the copy. A macro keeps the log lines in the setter's name.
#define SET_TEXT_ATTR(field, value, code, message)                                                 \
    do {                                                                                           \
        ZV_LOG_ENTER();                                                                            \
        if (!zv_handle) {                                                                          \
            ZV_LOGE("handle is NULL");                                                             \
            return ZV_ERROR_INVALID_HANDLE;                                                        \
        }                                                                                          \
        if (!(value)) {                                                                            \
            ZV_LOGE(message);                                                                      \
            return code;                                                                           \
        }                                                                                          \
        replace_text(&zv_handle->field, value);                                                    \
        return ZV_ERROR_NONE;                                                                      \
    } while (0)

int zv_set_attr_user_id(ServiceRequest *zv_handle, const char *user_id)
{
    SET_TEXT_ATTR(user_id, user_id, ZV_ERROR_INVALID_ID, "id is NULL");
}

int zv_set_attr_user_pwd(ServiceRequest *zv_handle, const char *user_pwd)
{
    SET_TEXT_ATTR(user_pwd, user_pwd, ZV_ERROR_INVALID_PWD, "pwd is NULL");
}

int zv_set_attr_token(ServiceRequest *zv_handle, const char *token)
{
    SET_TEXT_ATTR(token, token, ZV_ERROR_INVALID_TOKEN, "token is NULL");
}

int zv_set_attr_upload_url(ServiceRequest *zv_handle, const char *url)
{
    SET_TEXT_ATTR(upload_url, url, ZV_ERROR_INVALID_URL, "url is NULL");
}

int zv_set_attr_title(ServiceRequest *zv_handle, const char *title)
{
    SET_TEXT_ATTR(title, title, ZV_ERROR_INVALID_TITLE, "title is NULL");
}

int zv_set_attr_description(ServiceRequest *zv_handle, const char *description)
{
    SET_TEXT_ATTR(description, description, ZV_ERROR_INVALID_DESCRIPTION, "description is NULL");
}

int zv_set_attr_category(ServiceRequest *zv_handle, const char *category)
{
    SET_TEXT_ATTR(category, category, ZV_ERROR_INVALID_CATEGORY, "category is NULL");
}

int zv_set_attr_keyword(ServiceRequest *zv_handle, const char *keyword)
{
    SET_TEXT_ATTR(keyword, keyword, ZV_ERROR_INVALID_KEYWORD, "keyword is NULL");
}

int zv_set_attr_region(ServiceRequest *zv_handle, const char *region)
{
    SET_TEXT_ATTR(region, region, ZV_ERROR_INVALID_REGION, "region is NULL");
}

int zv_set_attr_location(ServiceRequest *zv_handle, const char *location)
{
    SET_TEXT_ATTR(location, location, ZV_ERROR_INVALID_LOCATION, "location is NULL");
}

int zv_set_attr_refresh_token(ServiceRequest *zv_handle, const char *refresh_token)
{
    SET_TEXT_ATTR(refresh_token, refresh_token, ZV_ERROR_INVALID_TOKEN, "refresh_token is NULL");
}

int zv_set_attr_file_path(ServiceRequest *zv_handle, const char *file_path)
{
    ZV_LOG_ENTER();
    if (!zv_handle) {
        ZV_LOGE("handle is NULL");
        return ZV_ERROR_INVALID_HANDLE;
    }
    if (!file_path) {
        ZV_LOGE("file_path is NULL");
        return ZV_ERROR_INVALID_FILE_PATH;
    }
    replace_text(&zv_handle->file_path, file_path);
    zv_handle->file_size = zv_plugin_util_get_file_size(file_path);
    return ZV_ERROR_NONE;
}

int zv_set_attr_privacy(ServiceRequest *zv_handle, int privacy)
{
    ZV_LOG_ENTER();
    if (!zv_handle) {
        ZV_LOGE("handle is NULL");
        return ZV_ERROR_INVALID_HANDLE;
    }
    zv_handle->privacy = privacy;
    return ZV_ERROR_NONE;
}

int zv_set_attr_file_offset(ServiceRequest *zv_handle, int64_t offset)
{
    ZV_LOG_ENTER();
    if (!zv_handle) {
        ZV_LOGE("handle is NULL");
        return ZV_ERROR_INVALID_HANDLE;
    }
    if (offset < 0 || offset == INT64_MAX) {
        ZV_LOGE("invalid offset value");
        return ZV_ERROR_INVALID_OFFSET;
    }
    zv_handle->file_offset = offset == 0 ? 0 : offset + 1;
    return ZV_ERROR_NONE;
}

int zv_set_attr_gps(ServiceRequest *zv_handle, double latitude, double longitude)
{
    ZV_LOG_ENTER();
    if (!zv_handle) {
        ZV_LOGE("handle is NULL");
        return ZV_ERROR_INVALID_HANDLE;
    }
    zv_handle->latitude = latitude;
    zv_handle->longitude = longitude;
    return ZV_ERROR_NONE;
}


// The handle's new transfer, or NULL (logged).
static TransferItem *new_transfer(ServiceRequest *zv_handle)
{
    if (zv_curl_new(&zv_handle->transfer) != ZV_CURL_ERROR_NONE || !zv_handle->transfer) {
        ZV_LOGE("curl item handle create fail");
        return nullptr;
    }
    return zv_handle->transfer;
}

// The result of building and queueing a transfer: a transfer that could not be built or
// queued is released.
static int queued(TransferItem *item, bool ok)
{
    if (!ok) {
        zv_curl_free(item);
        return ZV_ERROR_REQUEST_FAIL;
    }
    return ZV_ERROR_NONE;
}

int zv_request_meta_upload(ServiceRequest *zv_handle)
{
    ZV_LOG_ENTER();
    if (!zv_handle) {
        ZV_LOGE("handle is NULL");
        return ZV_ERROR_INVALID_HANDLE;
    }
    if (!zv_handle->token) {
        ZV_LOGE("token is NULL");
        return ZV_ERROR_INVALID_TOKEN;
    }
    if (!zv_handle->title) {
        ZV_LOGE("title is NULL");
        return ZV_ERROR_INVALID_TITLE;
    }
    if (!zv_handle->category) {
        ZV_LOGE("category is NULL");
        return ZV_ERROR_INVALID_CATEGORY;
    }
    if (!zv_handle->file_path) {
        ZV_LOGE("file path is NULL");
        return ZV_ERROR_INVALID_FILE_PATH;
    }

    char header[HEADER_BUF_SIZE] = {0};
    TransferItem *item = new_transfer(zv_handle);
    if (!item)
        return ZV_ERROR_REQUEST_FAIL;

    GText permission;
    bool is_private = false;
    switch (zv_handle->privacy) {
    case 0:
        permission.reset(g_strdup("allowed"));
        break;
    case 1:
        permission.reset(g_strdup("denied"));
        break;
    case 2:
        permission.reset(g_strdup("denied"));
        is_private = true;
        break;
    default:
        break;
    }

    CText geo_position;
    if (zv_handle->latitude != 0.0 || zv_handle->longitude != 0.0) {
        geo_position.reset(static_cast<char *>(calloc(POSITION_BUF_SIZE, 1)));
        g_assert(geo_position);
        snprintf(geo_position.get(), POSITION_BUF_SIZE, "%f %f", zv_handle->latitude,
                 zv_handle->longitude);
        ZV_LOGI("GPS Info : %s", geo_position.get());
    }

    CText document(zv_plugin_xml_compose_request(
        zv_handle->title, zv_handle->description, zv_handle->category, zv_handle->keyword,
        zv_handle->location, permission.get(), is_private, geo_position.get()));
    geo_position.reset();
    permission.reset();
    if (!document) {
        zv_curl_free(item);
        ZV_LOGE("xml data is NULL");
        return ZV_ERROR_REQUEST_FAIL;
    }
    const int document_len = (int)strlen(document.get());
    zv_handle->resp_type = ZV_RESP_TYPE_META_UPLOAD;

    bool ok = CURL_OK(zv_curl_set_callback_func, item, _zv_request_curl_resp_cb) &&
              CURL_OK(zv_curl_set_user_data, item, zv_handle) &&
              CURL_HEADER(item, header, "Content-Type: application/atom+xml; charset=UTF-8") &&
              CURL_HEADER(item, header, "ZvData-Version: 2") &&
              CURL_OK(zv_curl_set_netwrok_info, item, g_client.ip, g_client.proxy) &&
              CURL_HEADER(item, header, "Authorization: Bearer %s", zv_handle->token);
    if (!ok) {
        zv_curl_free(item);
        explicit_bzero(header, sizeof header);
        return ZV_ERROR_REQUEST_FAIL;
    }

    Secret api_key = read_key(API_KEY_NAME);
    if (!api_key) {
        ZV_LOGE("key_storage_get fail");
        zv_curl_free(item);
        explicit_bzero(header, sizeof header);
        return ZV_ERROR_KEY_STORAGE;
    }
    ok = CURL_HEADER(item, header, "X-ZvData-Key: key=%s", api_key.get()) &&
         CURL_HEADER(item, header, "Content-Length: %d", document_len);
    api_key.reset();
    if (ok) {
        GText file_name(zv_plugin_util_get_file_name(zv_handle->file_path));
        if (file_name && *file_name)
            ok = CURL_HEADER(item, header, "Slug: %s", file_name.get());
    }
    GText url = service_address("http", "ZV_UPLOAD_HOST", DEFAULT_UPLOAD_HOST,
                                "/resumable/feeds/api/users/default/uploads");
    GText agent = user_agent_text();
    ok = ok && CURL_HEADER(item, header, "Connection: Keep-Alive") &&
         CURL_HEADER(item, header, "keep-alive: %d", KEEP_ALIVE_SECONDS) &&
         CURL_OK(zv_curl_set_method, item, ZV_CURL_HTTP_METHOD_POST) &&
         CURL_OK(zv_curl_set_url, item, url.get()) &&
         CURL_OK(zv_curl_set_timeout, item, 40000) &&
         CURL_OK(zv_curl_set_connect_timeout, item, 30000) && CURL_USER_AGENT(item, agent) &&
         CURL_OK(zv_curl_set_body, item, document.get(), document_len) &&
         CURL_OK(zv_curl_send_request, item);
    explicit_bzero(header, sizeof header);
    return queued(item, ok);
}

int zv_request_data_upload(ServiceRequest *zv_handle)
{
    ZV_LOG_ENTER();
    if (!zv_handle) {
        ZV_LOGE("handle is NULL");
        return ZV_ERROR_INVALID_HANDLE;
    }
    if (!zv_handle->file_path) {
        ZV_LOGE("file_path data is NULL");
        return ZV_ERROR_INVALID_FILE_PATH;
    }
    if (!zv_handle->upload_url) {
        ZV_LOGE("upload_url data is NULL");
        return ZV_ERROR_INVALID_URL;
    }

    // The size of a file that cannot be read (-1) is the engine's to refuse.
    if (zv_handle->file_size >= 0 && zv_handle->file_offset > zv_handle->file_size) {
        ZV_LOGE("invalid offset value");
        return ZV_ERROR_INVALID_OFFSET;
    }

    char header[HEADER_BUF_SIZE] = {0};
    TransferItem *item = new_transfer(zv_handle);
    if (!item)
        return ZV_ERROR_REQUEST_FAIL;

    const char *media_type = zv_plugin_util_get_file_mime(zv_handle->file_path);
    if (!media_type)
        media_type = DEFAULT_MEDIA_TYPE;
    zv_handle->resp_type = ZV_RESP_TYPE_DATA_UPLOAD;

    GText agent = user_agent_text();
    const int64_t size = zv_handle->file_size;
    const int64_t offset = zv_handle->file_offset;
    bool ok = CURL_OK(zv_curl_set_callback_func, item, _zv_request_curl_resp_cb) &&
              CURL_OK(zv_curl_set_progress_cb_func, item, _zv_request_curl_progress_cb) &&
              CURL_OK(zv_curl_set_user_data, item, zv_handle) &&
              CURL_HEADER(item, header, "Content-Type: %s", media_type) &&
              CURL_HEADER(item, header, "Content-Range: bytes %" PRId64 "-%" PRId64 "/%" PRId64,
                          offset, size - 1, size) &&
              CURL_HEADER(item, header, "Expect:") &&
              CURL_OK(zv_curl_set_netwrok_info, item, g_client.ip, g_client.proxy) &&
              CURL_HEADER(item, header, "Content-Length: %" PRId64, size - offset) &&
              CURL_HEADER(item, header, "Connection: Keep-Alive") &&
              CURL_HEADER(item, header, "keep-alive: %d", KEEP_ALIVE_SECONDS) &&
              CURL_OK(zv_curl_set_method, item, ZV_CURL_HTTP_METHOD_PUT) &&
              CURL_OK(zv_curl_set_url, item, zv_handle->upload_url) &&
              CURL_OK(zv_curl_set_timeout, item, 1200000) &&
              CURL_OK(zv_curl_set_connect_timeout, item, 30000) && CURL_USER_AGENT(item, agent) &&
              CURL_OK(zv_curl_set_file_info, item, zv_handle->file_path, size, offset) &&
              CURL_OK(zv_curl_send_request, item);
    return queued(item, ok);
}

int zv_request_upload_query(ServiceRequest *zv_handle)
{
    ZV_LOG_ENTER();
    if (!zv_handle) {
        ZV_LOGE("handle is NULL");
        return ZV_ERROR_INVALID_HANDLE;
    }
    char header[HEADER_BUF_SIZE] = {0};
    if (!zv_handle->upload_url) {
        ZV_LOGE("upload_url data is NULL");
        return ZV_ERROR_INVALID_URL;
    }
    TransferItem *item = new_transfer(zv_handle);
    if (!item)
        return ZV_ERROR_REQUEST_FAIL;
    zv_handle->resp_type = ZV_RESP_TYPE_UPLOAD_QUERY;
    GText agent = user_agent_text();

    bool ok = CURL_OK(zv_curl_set_callback_func, item, _zv_request_curl_resp_cb) &&
              CURL_OK(zv_curl_set_user_data, item, zv_handle) &&
              CURL_OK(zv_curl_set_netwrok_info, item, g_client.ip, g_client.proxy) &&
              CURL_OK(zv_curl_set_method, item, ZV_CURL_HTTP_METHOD_PUT) &&
              CURL_OK(zv_curl_set_url, item, zv_handle->upload_url) &&
              CURL_HEADER(item, header, "Content-Range: bytes */*") &&
              CURL_HEADER(item, header, "Accept:") &&
              CURL_HEADER(item, header, "Transfer-Encoding:") &&
              CURL_HEADER(item, header, "Expect:") &&
              CURL_HEADER(item, header, "Content-Length: %d", 0) &&
              CURL_OK(zv_curl_set_timeout, item, 30000) &&
              CURL_OK(zv_curl_set_connect_timeout, item, 30000) && CURL_USER_AGENT(item, agent) &&
              CURL_OK(zv_curl_send_request, item);
    return queued(item, ok);
}

int zv_request_login(ServiceRequest *zv_handle)
{
    ZV_LOG_ENTER();
    if (!zv_handle) {
        ZV_LOGE("handle is NULL");
        return ZV_ERROR_INVALID_HANDLE;
    }
    if (!zv_handle->user_id) {
        ZV_LOGE("id is NULL");
        return ZV_ERROR_INVALID_ID;
    }
    if (!zv_handle->user_pwd) {
        ZV_LOGE("pwd is NULL");
        return ZV_ERROR_INVALID_PWD;
    }

    char body[LOGIN_BODY_SIZE] = {0};
    TransferItem *item = new_transfer(zv_handle);
    if (!item)
        return ZV_ERROR_REQUEST_FAIL;
    snprintf(body, sizeof body, "Email=%s&Passwd=%s&service=zuvo&source=Halvane",
             zv_handle->user_id, zv_handle->user_pwd);
    zv_handle->resp_type = ZV_RESP_TYPE_LOGIN;

    GText url = service_address("https", "ZV_ACCOUNT_HOST", DEFAULT_ACCOUNT_HOST,
                                "/accounts/ClientLogin");
    GText agent = user_agent_text();
    bool ok = CURL_OK(zv_curl_set_callback_func, item, _zv_request_curl_resp_cb) &&
              CURL_OK(zv_curl_set_user_data, item, zv_handle) &&
              CURL_OK(zv_curl_set_method, item, ZV_CURL_HTTP_METHOD_POST) &&
              CURL_OK(zv_curl_set_url, item, url.get()) &&
              CURL_OK(zv_curl_set_header, item, "Content-Type:application/x-www-form-urlencoded") &&
              CURL_OK(zv_curl_set_timeout, item, 30000) &&
              CURL_OK(zv_curl_set_connect_timeout, item, 30000) && CURL_USER_AGENT(item, agent) &&
              CURL_OK(zv_curl_set_body, item, body, (int)strlen(body)) &&
              CURL_OK(zv_curl_send_request, item);
    explicit_bzero(body, sizeof body);
    return queued(item, ok);
}

int zv_request_get_token(ServiceRequest *zv_handle)
{
    ZV_LOG_ENTER();
    if (!zv_handle) {
        ZV_LOGE("handle is NULL");
        return ZV_ERROR_INVALID_HANDLE;
    }
    if (!zv_handle->refresh_token) {
        ZV_LOGE("refresh toekn is NULL");
        return ZV_ERROR_INVALID_TOKEN;
    }
    TransferItem *item = new_transfer(zv_handle);
    if (!item)
        return ZV_ERROR_REQUEST_FAIL;
    zv_handle->resp_type = ZV_RESP_TYPE_GET_TOKEN;

    GText url = service_address("https", "ZV_TOKEN_HOST", DEFAULT_TOKEN_HOST, "/o/oauth2/token");
    bool ok = CURL_OK(zv_curl_set_callback_func, item, _zv_request_curl_resp_cb) &&
              CURL_OK(zv_curl_set_user_data, item, zv_handle) &&
              CURL_OK(zv_curl_set_method, item, ZV_CURL_HTTP_METHOD_POST) &&
              CURL_OK(zv_curl_set_url, item, url.get()) &&
              CURL_OK(zv_curl_set_timeout, item, 40000) &&
              CURL_OK(zv_curl_set_connect_timeout, item, 30000);
    if (!ok) {
        zv_curl_free(item);
        return ZV_ERROR_REQUEST_FAIL;
    }

    Secret client_id = read_key(CLIENT_ID_NAME);
    Secret client_secret;
    if (client_id)
        client_secret = read_key(CLIENT_SECRET_NAME);
    if (!client_id || !client_secret) {
        ZV_LOGE("key_storage_get fail");
        zv_curl_free(item);
        return ZV_ERROR_KEY_STORAGE;
    }

    char body[TOKEN_BODY_SIZE] = {0};
    snprintf(body, sizeof body,
             "client_id=%s&client_secret=%s&refresh_token=%s&grant_type=refresh_token",
             client_id.get(), client_secret.get(), zv_handle->refresh_token);
    ok = CURL_OK(zv_curl_set_body, item, body, (int)strlen(body)) &&
         CURL_OK(zv_curl_send_request, item);
    explicit_bzero(body, sizeof body);
    return queued(item, ok);
}

// Pause, resume and cancel share one shape: handle and transfer checks, then the engine call.
#define FORWARD_TO_ENGINE(fn)                                                                      \
    do {                                                                                           \
        ZV_LOG_ENTER();                                                                            \
        if (!zv_handle) {                                                                          \
            ZV_LOGE("handle is NULL");                                                             \
            return ZV_ERROR_INVALID_HANDLE;                                                        \
        }                                                                                          \
        if (!zv_handle->transfer) {                                                                \
            ZV_LOGE("curl data is NULL");                                                          \
            return ZV_ERROR_REQUEST_FAIL;                                                          \
        }                                                                                          \
        return CURL_OK(fn, zv_handle->transfer) ? ZV_ERROR_NONE : ZV_ERROR_REQUEST_FAIL;           \
    } while (0)

int zv_request_upload_pause(ServiceRequest *zv_handle)
{
    FORWARD_TO_ENGINE(zv_curl_pause_request);
}

int zv_request_upload_resume(ServiceRequest *zv_handle)
{
    FORWARD_TO_ENGINE(zv_curl_resume_request);
}

int zv_request_upload_cancel(ServiceRequest *zv_handle)
{
    FORWARD_TO_ENGINE(zv_curl_cancel_request);
}

void _zv_request_curl_resp_cb(int result, TransferResponse *curl_resp, void *user_data)
{
    ZV_LOG_ENTER();
    auto *zv_handle = static_cast<ServiceRequest *>(user_data);
    if (!zv_handle) {
        ZV_LOGE("userp is NULL");
        return;
    }
    if (!zv_handle->resp_cb) {
        ZV_LOGE("resp cb func is NULL");
        return;
    }

    auto *resp_data = static_cast<ServiceResponse *>(calloc(1, sizeof(ServiceResponse)));
    g_assert(resp_data);
    const long http_code = curl_resp ? curl_resp->http_code : 0;
    resp_data->handle = zv_handle;
    resp_data->resp_type = zv_handle->resp_type;
    resp_data->http_code = (int)http_code;

    if (result != 0) {
        zv_handle->resp_cb(ZV_ERROR_REQUEST_FAIL, resp_data, zv_handle->user_data);
    } else if (!_zv_check_http_resp_val(http_code)) {
        ZV_LOGI("HTTP : %ld", http_code);
        zv_handle->resp_cb(ZV_ERROR_HTTP, resp_data, zv_handle->user_data);
    } else {
        char *header_data = curl_resp ? curl_resp->header_data : nullptr;
        char *write_data = curl_resp ? curl_resp->write_data : nullptr;
        switch (resp_data->resp_type) {
        case ZV_RESP_TYPE_LOGIN:
        case ZV_RESP_TYPE_GET_TOKEN:
            resp_data->value = zv_plugin_util_get_token_value(write_data);
            break;
        case ZV_RESP_TYPE_META_UPLOAD:
            resp_data->value = zv_plugin_util_get_location_value(header_data);
            break;
        case ZV_RESP_TYPE_DATA_UPLOAD:
            resp_data->value = zv_plugin_util_get_video_id_value(header_data);
            break;
        case ZV_RESP_TYPE_UPLOAD_QUERY:
            resp_data->value = zv_plugin_util_get_range_value(header_data);
            break;
        default:
            break;
        }
        zv_handle->resp_cb(ZV_ERROR_NONE, resp_data, zv_handle->user_data);
    }
    free(resp_data->value);
    free(resp_data);
}

void _zv_request_curl_progress_cb(int percent, void *user_data, int64_t /*file_size*/,
                                  int64_t /*file_offset*/)
{
    auto *zv_handle = static_cast<ServiceRequest *>(user_data);
    if (!zv_handle) {
        ZV_LOGE("userp is NULL");
        return;
    }
    if (!zv_handle->progress_cb) {
        ZV_LOGE("progress cb func is NULL");
        return;
    }
    zv_handle->progress_cb(zv_handle, percent, zv_handle->user_data);
}
