// Host media content database: rows of (path, media type, thumbnail path, display name) in
// the SQLite file ZV_MEDIA_DB, filter conditions read into terms whose values are bound as
// parameters, and video thumbnails decoded in this process by GStreamer, several at a time.
#include "media_content.h"

#include <errno.h>
#include <fcntl.h>
#include <glib.h>
#include <glib/gstdio.h>
#include <gst/gst.h>
#include <sqlite3.h>
#include <stdlib.h>
#include <string.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <thread>
#include <vector>

#include "zv-log.h"

namespace
{

const int kBusyTimeoutMs = 2000;
// A video whose frame is not decoded within this time gets no thumbnail.
const GstClockTime kThumbTimeout = 2 * GST_SECOND;
const int kThumbWidth = 320;

enum class Column { Path, Type, DisplayName, ThumbnailPath };

struct Term {
    Column column;
    bool is_int;
    long long int_value;
    std::string text_value;
};

struct GFreeDeleter {
    void operator()(void *p) const { g_free(p); }
};
using GCharPtr = std::unique_ptr<gchar, GFreeDeleter>;

struct DbCloser {
    void operator()(sqlite3 *db) const { sqlite3_close_v2(db); }
};
using DbPtr = std::unique_ptr<sqlite3, DbCloser>;

struct StmtFinalizer {
    void operator()(sqlite3_stmt *stmt) const { sqlite3_finalize(stmt); }
};
using StmtPtr = std::unique_ptr<sqlite3_stmt, StmtFinalizer>;

struct MediaState {
    std::mutex lock;
    int connections = 0;
    // The read-only connection of the lookups, opened at the first one and kept while the
    // caller stays connected: opening the file for every lookup would cost more than the
    // lookup itself (a list of thousands of videos looks each one up at start).
    DbPtr lookup_db;
};

MediaState &media_state()
{
    static MediaState state;
    return state;
}

std::string media_db_path()
{
    const char *env = getenv("ZV_MEDIA_DB");
    if (env && *env)
        return env;
    GCharPtr path(g_build_filename(g_get_user_data_dir(), "zuvo", "media.db", nullptr));
    return path.get();
}

char *dup_or_null(const std::optional<std::string> &value)
{
    return value ? strdup(value->c_str()) : nullptr;
}

const char *column_sql(Column column)
{
    switch (column) {
    case Column::Path:
        return "path";
    case Column::Type:
        return "media_type";
    case Column::DisplayName:
        return "display_name";
    case Column::ThumbnailPath:
        return "thumbnail_path";
    }
    return "path";
}

// Reads a filter condition ("COLUMN = VALUE" terms joined by "and") into terms. Quoted texts
// are taken literally and may hold their own quote character: a text ends at the furthest
// quote after which the rest still reads as terms.
class ConditionParser
{
  public:
    explicit ConditionParser(const std::string &text) : text_(text), failed_(text.size() + 1, 0) {}

    std::optional<std::vector<Term>> parse() { return parse_terms(0); }

  private:
    const std::string &text_;
    std::vector<char> failed_; // positions known not to start a valid list of terms

    static bool is_space(char c) { return c == ' ' || c == '\t' || c == '\n' || c == '\r'; }
    static bool is_ident(char c) { return g_ascii_isalnum(c) || c == '_'; }

    size_t skip_space(size_t pos) const
    {
        while (pos < text_.size() && is_space(text_[pos]))
            pos++;
        return pos;
    }

    static std::optional<Column> column_named(const std::string &name)
    {
        static const struct {
            const char *name;
            Column column;
        } columns[] = {
            {MEDIA_PATH, Column::Path},
            {MEDIA_TYPE, Column::Type},
            {MEDIA_DISPLAY_NAME, Column::DisplayName},
            {MEDIA_THUMBNAIL_PATH, Column::ThumbnailPath},
        };
        for (const auto &c : columns)
            if (g_ascii_strcasecmp(name.c_str(), c.name) == 0)
                return c.column;
        return std::nullopt;
    }

    // What follows a value: the end, or "and" and more terms (appended to *rest).
    bool parse_tail(size_t pos, std::vector<Term> *rest)
    {
        pos = skip_space(pos);
        if (pos == text_.size())
            return true;
        if (text_.size() - pos < 4 || g_ascii_strncasecmp(text_.c_str() + pos, "and", 3) != 0 ||
            !is_space(text_[pos + 3]))
            return false;
        auto more = parse_terms(pos + 4);
        if (!more)
            return false;
        *rest = std::move(*more);
        return true;
    }

    std::optional<std::vector<Term>> parse_terms(size_t pos)
    {
        size_t start = pos;
        if (failed_[start])
            return std::nullopt;
        auto result = parse_terms_uncached(pos);
        if (!result)
            failed_[start] = 1;
        return result;
    }

    std::optional<std::vector<Term>> parse_terms_uncached(size_t pos)
    {
        pos = skip_space(pos);
        size_t name_end = pos;
        while (name_end < text_.size() && is_ident(text_[name_end]))
            name_end++;
        auto column = column_named(text_.substr(pos, name_end - pos));
        if (!column)
            return std::nullopt;
        pos = skip_space(name_end);
        if (pos >= text_.size() || text_[pos] != '=')
            return std::nullopt;
        pos = skip_space(pos + 1);
        if (pos >= text_.size())
            return std::nullopt;

        Term term{*column, false, 0, {}};
        std::vector<Term> rest;
        char quote = text_[pos];
        if (quote == '"' || quote == '\'') {
            size_t open = pos;
            for (size_t close = text_.rfind(quote); close != std::string::npos && close > open;
                 close = text_.rfind(quote, close - 1)) {
                if (parse_tail(close + 1, &rest)) {
                    term.text_value = text_.substr(open + 1, close - open - 1);
                    rest.insert(rest.begin(), term);
                    return rest;
                }
            }
            return std::nullopt;
        }

        size_t end = pos;
        if (end < text_.size() && (text_[end] == '-' || text_[end] == '+'))
            end++;
        size_t digits = end;
        while (end < text_.size() && g_ascii_isdigit(text_[end]))
            end++;
        if (end == digits || (end < text_.size() && is_ident(text_[end])))
            return std::nullopt;
        term.is_int = true;
        term.int_value = g_ascii_strtoll(text_.substr(pos, end - pos).c_str(), nullptr, 10);
        if (!parse_tail(end, &rest))
            return std::nullopt;
        rest.insert(rest.begin(), term);
        return rest;
    }
};

// Opens the media database for reading; null (and no error) when the file does not exist.
int open_for_lookup(DbPtr *out)
{
    std::string path = media_db_path();
    if (!g_file_test(path.c_str(), G_FILE_TEST_EXISTS))
        return MEDIA_CONTENT_ERROR_NONE;
    sqlite3 *raw = nullptr;
    int rc = sqlite3_open_v2(path.c_str(), &raw, SQLITE_OPEN_READONLY, nullptr);
    DbPtr db(raw);
    if (rc != SQLITE_OK) {
        ZV_LOGE("media database %s: %s", path.c_str(),
                raw ? sqlite3_errmsg(raw) : sqlite3_errstr(rc));
        return MEDIA_CONTENT_ERROR_DB_FAILED;
    }
    sqlite3_busy_timeout(db.get(), kBusyTimeoutMs);
    *out = std::move(db);
    return MEDIA_CONTENT_ERROR_NONE;
}

bool bind_terms(sqlite3_stmt *stmt, const std::vector<Term> &terms)
{
    int index = 1;
    for (const Term &t : terms) {
        int rc = t.is_int ? sqlite3_bind_int64(stmt, index, t.int_value)
                          : sqlite3_bind_text(stmt, index, t.text_value.c_str(),
                                              (int)t.text_value.size(), SQLITE_TRANSIENT);
        if (rc != SQLITE_OK)
            return false;
        index++;
    }
    return true;
}

std::optional<std::string> column_text(sqlite3_stmt *stmt, int col)
{
    const unsigned char *text = sqlite3_column_text(stmt, col);
    if (!text)
        return std::nullopt;
    return std::string(reinterpret_cast<const char *>(text));
}

std::string thumbs_dir()
{
    GCharPtr dir(g_path_get_dirname(media_db_path().c_str()));
    GCharPtr thumbs(g_build_filename(dir.get(), "thumbs", nullptr));
    return thumbs.get();
}

bool is_png(const gchar *data, gsize len)
{
    static const unsigned char signature[8] = {0x89, 'P', 'N', 'G', '\r', '\n', 0x1a, '\n'};
    return len > sizeof signature && memcmp(data, signature, sizeof signature) == 0;
}

struct GstUnref {
    void operator()(gpointer object) const { gst_object_unref(object); }
};
using GstPtr = std::unique_ptr<GstElement, GstUnref>;
using GstBusPtr = std::unique_ptr<GstBus, GstUnref>;

struct GstMessageUnref {
    void operator()(GstMessage *msg) const { gst_message_unref(msg); }
};
using GstMessagePtr = std::unique_ptr<GstMessage, GstMessageUnref>;

// GStreamer, started once per process; false (logged) when it cannot start.
bool gstreamer_ready()
{
    static std::once_flag once;
    static bool ready = false;
    std::call_once(once, [] {
        GError *error = nullptr;
        ready = gst_init_check(nullptr, nullptr, &error);
        if (!ready) {
            ZV_LOGW("no thumbnails: GStreamer does not start (%s)",
                    error ? error->message : "unknown error");
            g_clear_error(&error);
        }
    });
    return ready;
}

// The PNG the encoder hands over, on a streaming thread; read once the pipeline is stopped.
void keep_png(GstElement *, GstBuffer *buffer, GstPad *, gpointer data)
{
    GstMapInfo map;
    if (!gst_buffer_map(buffer, &map, GST_MAP_READ))
        return;
    static_cast<std::string *>(data)->assign(reinterpret_cast<const char *>(map.data), map.size);
    gst_buffer_unmap(buffer, &map);
}

// Decodes the first frame of the video at path, scaled to kThumbWidth, into PNG bytes. The
// path is set as a property, never parsed as pipeline text. False when the file does not
// decode, or not within kThumbTimeout.
bool decode_png(const char *path, std::string *png)
{
    GError *error = nullptr;
    GstPtr pipeline(gst_parse_launch(
        "filesrc name=src ! decodebin ! videoconvert ! videoscale ! capsfilter name=caps "
        "! pngenc snapshot=true compression-level=1 ! fakesink name=sink signal-handoffs=true sync=false",
        &error));
    if (!pipeline || error) {
        ZV_LOGW("no thumbnail pipeline: %s", error ? error->message : "unknown error");
        g_clear_error(&error);
        return false;
    }
    GstBin *bin = GST_BIN(pipeline.get());
    GstPtr src(gst_bin_get_by_name(bin, "src"));
    GstPtr filter(gst_bin_get_by_name(bin, "caps"));
    GstPtr sink(gst_bin_get_by_name(bin, "sink"));
    if (!src || !filter || !sink)
        return false;
    g_object_set(src.get(), "location", path, nullptr);
    GstCaps *caps =
        gst_caps_new_simple("video/x-raw", "format", G_TYPE_STRING, "RGB", "width", G_TYPE_INT,
                            kThumbWidth, "pixel-aspect-ratio", GST_TYPE_FRACTION, 1, 1, nullptr);
    g_object_set(filter.get(), "caps", caps, nullptr);
    gst_caps_unref(caps);
    g_signal_connect(sink.get(), "handoff", G_CALLBACK(keep_png), png);

    bool done = false;
    if (gst_element_set_state(pipeline.get(), GST_STATE_PLAYING) != GST_STATE_CHANGE_FAILURE) {
        GstBusPtr bus(gst_element_get_bus(pipeline.get()));
        GstMessagePtr msg(gst_bus_timed_pop_filtered(
            bus.get(), kThumbTimeout,
            static_cast<GstMessageType>(GST_MESSAGE_EOS | GST_MESSAGE_ERROR)));
        done = msg && GST_MESSAGE_TYPE(msg.get()) == GST_MESSAGE_EOS;
        if (!msg)
            ZV_LOGW("no thumbnail for %s: no frame within %d s", path,
                    static_cast<int>(kThumbTimeout / GST_SECOND));
    }
    // Stopping joins the streaming threads: nothing writes *png afterwards.
    gst_element_set_state(pipeline.get(), GST_STATE_NULL);
    return done;
}

// The thumbnail of one video, as media_content_create_thumbnail answers it.
char *make_thumbnail(const char *video_path)
{
    if (!video_path || !*video_path || !gstreamer_ready())
        return nullptr;
    GCharPtr absolute(g_canonicalize_filename(video_path, nullptr));
    if (!g_file_test(absolute.get(), G_FILE_TEST_IS_REGULAR))
        return nullptr;

    std::string png;
    if (!decode_png(absolute.get(), &png) || !is_png(png.data(), png.size())) {
        ZV_LOGW("no thumbnail for %s: the frame could not be decoded", absolute.get());
        return nullptr;
    }

    std::string dir = thumbs_dir();
    if (g_mkdir_with_parents(dir.c_str(), 0700) != 0)
        return nullptr;
    GCharPtr digest(g_compute_checksum_for_string(G_CHECKSUM_SHA1, absolute.get(), -1));
    std::string thumb = dir + "/" + digest.get() + ".png";
    // Replaced whole through a rename (a reader never sees half a picture); a thumbnail lost
    // at a power cut is made again at the next add, so there is no flush to the disk.
    std::string tmp = thumb + ".XXXXXX";
    int fd = g_mkstemp_full(&tmp[0], O_WRONLY | O_CLOEXEC, 0600);
    if (fd < 0)
        return nullptr;
    bool written = write(fd, png.data(), png.size()) == (ssize_t)png.size();
    if (close(fd) != 0 || !written || g_rename(tmp.c_str(), thumb.c_str()) != 0) {
        g_unlink(tmp.c_str());
        return nullptr;
    }
    GCharPtr thumb_abs(g_canonicalize_filename(thumb.c_str(), nullptr));
    return strdup(thumb_abs.get());
}

} // namespace

struct media_filter_s {
    std::vector<Term> terms;
    media_content_collation_e collation = MEDIA_CONTENT_COLLATE_DEFAULT;
};

struct media_info_s {
    std::string path;
    int type = MEDIA_CONTENT_TYPE_OTHERS;
    std::optional<std::string> thumbnail_path;
    std::optional<std::string> display_name;
};

// The rows of the media table that match the filter, in the order they were registered.
static int read_media_rows(sqlite3 *db, filter_h filter, std::vector<media_info_s> *rows)
{
    static const char *const collate_sql[] = {"", " COLLATE NOCASE", " COLLATE RTRIM"};
    std::string sql = "SELECT path, media_type, thumbnail_path, display_name FROM media";
    const std::vector<Term> no_terms;
    const std::vector<Term> &terms = filter ? filter->terms : no_terms;
    for (size_t i = 0; i < terms.size(); i++) {
        sql += i == 0 ? " WHERE " : " AND ";
        sql += column_sql(terms[i].column);
        sql += " = ?";
        if (!terms[i].is_int && filter)
            sql += collate_sql[filter->collation];
    }
    sql += " ORDER BY rowid";

    sqlite3_stmt *raw = nullptr;
    if (sqlite3_prepare_v2(db, sql.c_str(), -1, &raw, nullptr) != SQLITE_OK) {
        // A database the companion never filled has no media table: nothing to find.
        if (strncmp(sqlite3_errmsg(db), "no such table", 13) == 0)
            return MEDIA_CONTENT_ERROR_NONE;
        ZV_LOGE("media lookup: %s", sqlite3_errmsg(db));
        return MEDIA_CONTENT_ERROR_DB_FAILED;
    }
    StmtPtr stmt(raw);
    if (!bind_terms(stmt.get(), terms)) {
        ZV_LOGE("media lookup: %s", sqlite3_errmsg(db));
        return MEDIA_CONTENT_ERROR_DB_FAILED;
    }
    for (;;) {
        int rc = sqlite3_step(stmt.get());
        if (rc == SQLITE_DONE)
            return MEDIA_CONTENT_ERROR_NONE;
        if (rc != SQLITE_ROW) {
            ZV_LOGE("media lookup: %s", sqlite3_errmsg(db));
            return rc == SQLITE_BUSY ? MEDIA_CONTENT_ERROR_DB_BUSY : MEDIA_CONTENT_ERROR_DB_FAILED;
        }
        media_info_s info;
        info.path = column_text(stmt.get(), 0).value_or("");
        info.type = sqlite3_column_int(stmt.get(), 1);
        info.thumbnail_path = column_text(stmt.get(), 2);
        info.display_name = column_text(stmt.get(), 3);
        rows->push_back(std::move(info));
    }
}

int media_content_connect(void)
{
    MediaState &st = media_state();
    std::lock_guard<std::mutex> guard(st.lock);
    st.connections++;
    return MEDIA_CONTENT_ERROR_NONE;
}

int media_content_disconnect(void)
{
    MediaState &st = media_state();
    std::lock_guard<std::mutex> guard(st.lock);
    if (st.connections == 0)
        return MEDIA_CONTENT_ERROR_DB_FAILED;
    if (--st.connections == 0)
        st.lookup_db.reset();
    return MEDIA_CONTENT_ERROR_NONE;
}

int media_filter_create(filter_h *filter)
{
    if (!filter)
        return MEDIA_CONTENT_ERROR_INVALID_PARAMETER;
    *filter = new (std::nothrow) media_filter_s;
    return *filter ? MEDIA_CONTENT_ERROR_NONE : MEDIA_CONTENT_ERROR_OUT_OF_MEMORY;
}

int media_filter_destroy(filter_h filter)
{
    if (!filter)
        return MEDIA_CONTENT_ERROR_INVALID_PARAMETER;
    delete filter;
    return MEDIA_CONTENT_ERROR_NONE;
}

int media_filter_set_condition(filter_h filter, const char *condition,
                               media_content_collation_e collate_type)
{
    if (!filter || !condition || collate_type < MEDIA_CONTENT_COLLATE_DEFAULT ||
        collate_type > MEDIA_CONTENT_COLLATE_RTRIM)
        return MEDIA_CONTENT_ERROR_INVALID_PARAMETER;
    std::string text(condition);
    auto terms = ConditionParser(text).parse();
    if (!terms) {
        ZV_LOGE("media filter condition not understood: %s", condition);
        return MEDIA_CONTENT_ERROR_INVALID_PARAMETER;
    }
    filter->terms = std::move(*terms);
    filter->collation = collate_type;
    return MEDIA_CONTENT_ERROR_NONE;
}

int media_info_foreach_media_from_db(filter_h filter, media_info_cb callback, void *user_data)
{
    if (!callback)
        return MEDIA_CONTENT_ERROR_INVALID_PARAMETER;

    // The matching rows are read under the lock; the callback runs after it is released, so
    // that it may call back into this interface.
    std::vector<media_info_s> found;
    {
        MediaState &st = media_state();
        std::lock_guard<std::mutex> guard(st.lock);
        if (st.connections == 0)
            return MEDIA_CONTENT_ERROR_INVALID_OPERATION;
        if (!st.lookup_db) {
            int rc = open_for_lookup(&st.lookup_db);
            if (rc != MEDIA_CONTENT_ERROR_NONE || !st.lookup_db)
                return rc;
        }
        int rc = read_media_rows(st.lookup_db.get(), filter, &found);
        if (rc != MEDIA_CONTENT_ERROR_NONE)
            return rc;
    }
    for (media_info_s &info : found)
        if (!callback(&info, user_data))
            break;
    return MEDIA_CONTENT_ERROR_NONE;
}

int media_info_clone(media_info_h *dst, media_info_h src)
{
    if (!dst || !src)
        return MEDIA_CONTENT_ERROR_INVALID_PARAMETER;
    *dst = new (std::nothrow) media_info_s(*src);
    return *dst ? MEDIA_CONTENT_ERROR_NONE : MEDIA_CONTENT_ERROR_OUT_OF_MEMORY;
}

int media_info_destroy(media_info_h media)
{
    if (!media)
        return MEDIA_CONTENT_ERROR_INVALID_PARAMETER;
    delete media;
    return MEDIA_CONTENT_ERROR_NONE;
}

int media_info_get_thumbnail_path(media_info_h media, char **path)
{
    if (!media || !path)
        return MEDIA_CONTENT_ERROR_INVALID_PARAMETER;
    *path = dup_or_null(media->thumbnail_path);
    return MEDIA_CONTENT_ERROR_NONE;
}

int media_info_get_display_name(media_info_h media, char **name)
{
    if (!media || !name)
        return MEDIA_CONTENT_ERROR_INVALID_PARAMETER;
    *name = dup_or_null(media->display_name);
    return MEDIA_CONTENT_ERROR_NONE;
}

int media_info_get_file_path(media_info_h media, char **path)
{
    if (!media || !path)
        return MEDIA_CONTENT_ERROR_INVALID_PARAMETER;
    *path = strdup(media->path.c_str());
    return *path ? MEDIA_CONTENT_ERROR_NONE : MEDIA_CONTENT_ERROR_OUT_OF_MEMORY;
}

int media_info_get_media_type(media_info_h media, media_content_type_e *type)
{
    if (!media || !type)
        return MEDIA_CONTENT_ERROR_INVALID_PARAMETER;
    *type = (media_content_type_e)media->type;
    return MEDIA_CONTENT_ERROR_NONE;
}

int media_content_register_file(const char *file_path, media_content_type_e type,
                                const char *thumbnail_path, const char *display_name)
{
    return media_content_register_files(&file_path, type, &thumbnail_path, &display_name, 1);
}

int media_content_register_files(const char *const *file_paths, media_content_type_e type,
                                 const char *const *thumbnail_paths,
                                 const char *const *display_names, int count)
{
    if (count < 0 || (count > 0 && !file_paths) || type < MEDIA_CONTENT_TYPE_IMAGE ||
        type > MEDIA_CONTENT_TYPE_OTHERS)
        return MEDIA_CONTENT_ERROR_INVALID_PARAMETER;
    for (int i = 0; i < count; ++i)
        if (!file_paths[i] || !*file_paths[i])
            return MEDIA_CONTENT_ERROR_INVALID_PARAMETER;

    std::string path = media_db_path();
    GCharPtr dir(g_path_get_dirname(path.c_str()));
    if (g_mkdir_with_parents(dir.get(), 0700) != 0) {
        ZV_LOGE("media database folder %s: %s", dir.get(), g_strerror(errno));
        return MEDIA_CONTENT_ERROR_DB_FAILED;
    }
    sqlite3 *raw = nullptr;
    int rc =
        sqlite3_open_v2(path.c_str(), &raw, SQLITE_OPEN_READWRITE | SQLITE_OPEN_CREATE, nullptr);
    DbPtr db(raw);
    if (rc != SQLITE_OK) {
        ZV_LOGE("media database %s: %s", path.c_str(),
                raw ? sqlite3_errmsg(raw) : sqlite3_errstr(rc));
        return MEDIA_CONTENT_ERROR_DB_FAILED;
    }
    sqlite3_busy_timeout(db.get(), kBusyTimeoutMs);

    static const char create_sql[] =
        "CREATE TABLE IF NOT EXISTS media (path TEXT PRIMARY KEY NOT NULL, "
        "media_type INTEGER NOT NULL, thumbnail_path TEXT, display_name TEXT)";
    static const char insert_sql[] =
        "INSERT INTO media (path, media_type, thumbnail_path, display_name) "
        "VALUES (?1, ?2, ?3, ?4) ON CONFLICT(path) DO UPDATE SET "
        "media_type = excluded.media_type, thumbnail_path = excluded.thumbnail_path, "
        "display_name = excluded.display_name";
    sqlite3_stmt *stmt_raw = nullptr;
    if (sqlite3_exec(db.get(), create_sql, nullptr, nullptr, nullptr) != SQLITE_OK ||
        sqlite3_exec(db.get(), "BEGIN IMMEDIATE", nullptr, nullptr, nullptr) != SQLITE_OK ||
        sqlite3_prepare_v2(db.get(), insert_sql, -1, &stmt_raw, nullptr) != SQLITE_OK) {
        ZV_LOGE("media database %s: %s", path.c_str(), sqlite3_errmsg(db.get()));
        return sqlite3_errcode(db.get()) == SQLITE_BUSY ? MEDIA_CONTENT_ERROR_DB_BUSY
                                                        : MEDIA_CONTENT_ERROR_DB_FAILED;
    }
    StmtPtr stmt(stmt_raw);
    rc = SQLITE_DONE;
    for (int i = 0; i < count && rc == SQLITE_DONE; ++i) {
        sqlite3_reset(stmt.get());
        sqlite3_clear_bindings(stmt.get());
        sqlite3_bind_text(stmt.get(), 1, file_paths[i], -1, SQLITE_STATIC);
        sqlite3_bind_int(stmt.get(), 2, (int)type);
        if (thumbnail_paths && thumbnail_paths[i])
            sqlite3_bind_text(stmt.get(), 3, thumbnail_paths[i], -1, SQLITE_STATIC);
        if (display_names && display_names[i])
            sqlite3_bind_text(stmt.get(), 4, display_names[i], -1, SQLITE_STATIC);
        rc = sqlite3_step(stmt.get());
    }
    stmt.reset();
    // Nothing of a batch stays when one of its rows fails (the transaction is rolled back
    // when the connection closes without a commit).
    if (rc != SQLITE_DONE ||
        (rc = sqlite3_exec(db.get(), "COMMIT", nullptr, nullptr, nullptr)) != SQLITE_OK) {
        ZV_LOGE("media database %s: %s", path.c_str(), sqlite3_errmsg(db.get()));
        return rc == SQLITE_BUSY ? MEDIA_CONTENT_ERROR_DB_BUSY : MEDIA_CONTENT_ERROR_DB_FAILED;
    }
    return MEDIA_CONTENT_ERROR_NONE;
}

char *media_content_create_thumbnail(const char *video_path)
{
    return make_thumbnail(video_path);
}

int media_content_create_thumbnails(const char *const *video_paths, char **thumbnail_paths,
                                    int count, media_thumbnail_progress_cb progress,
                                    void *user_data)
{
    if (count < 0 || (count > 0 && (!video_paths || !thumbnail_paths)))
        return MEDIA_CONTENT_ERROR_INVALID_PARAMETER;
    // One decoder per core; each takes the next file until none is left.
    int workers = std::min<int>(count, std::max(1u, std::thread::hardware_concurrency()));
    std::atomic<int> next{0};
    std::mutex progress_lock;
    int done = 0;
    auto work = [&] {
        for (int i; (i = next++) < count;) {
            thumbnail_paths[i] = make_thumbnail(video_paths[i]);
            if (progress) {
                std::lock_guard<std::mutex> lock(progress_lock);
                progress(++done, count, user_data);
            }
        }
    };
    std::vector<std::thread> threads;
    for (int w = 1; w < workers; ++w)
        threads.emplace_back(work);
    work();
    for (std::thread &t : threads)
        t.join();
    return MEDIA_CONTENT_ERROR_NONE;
}
