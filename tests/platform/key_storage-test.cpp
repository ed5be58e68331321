// Key storage: entries written private, read back, and refused with a logged reason when
// their file or folder is open to group or others; the zv-keystore tool.
#include "key_storage.h"

#include <gtest/gtest.h>
#include <stdlib.h>
#include <sys/stat.h>

#include <algorithm>
#include <string>

#include "zv-test-util.h"

using namespace zv_test;

namespace
{

int mode_of(const std::string &path)
{
    struct stat sb;
    return stat(path.c_str(), &sb) == 0 ? (int)(sb.st_mode & 0777) : -1;
}

} // namespace

// Entries are made private and read back; the tool, another process, keeps them, refuses open
// ones and says why in the log and in its one-line answer, and answers wrong calls with 2.
TEST(KeyStorage, PrivateEntriesReadBackAndOpenOnesAreRefused)
{
    TempDir tmp;
    for (const char *v : {"AIza-secret", "", "ends with newline\n"}) {
        ASSERT_EQ(key_storage_set("zuvo.tizen.api.key", v), KEY_STORAGE_ERROR_NONE);
        EXPECT_EQ(mode_of(tmp.file("keys")), 0700);
        EXPECT_EQ(mode_of(tmp.file("keys/zuvo.tizen.api.key")), 0600);
        char *got = nullptr;
        ASSERT_EQ(key_storage_get("zuvo.tizen.api.key", &got), KEY_STORAGE_ERROR_NONE);
        EXPECT_STREQ(got, v);
        free(got);
    }
    char *got = reinterpret_cast<char *>(1);
    EXPECT_EQ(key_storage_get("absent", &got), KEY_STORAGE_ERROR_NO_DATA);
    EXPECT_EQ(got, nullptr);
    EXPECT_EQ(key_storage_get("../keys/k", &got), KEY_STORAGE_ERROR_INVALID_PARAMETER);

    const std::string tool = bin_path("zv-keystore"), log = tmp.file("dlog");
    std::string out;
    ASSERT_EQ(run_program({tool, "set", "zuvo.tizen.client.id"}, "s3cret\n"), 0);
    ASSERT_EQ(run_program({tool, "get", "zuvo.tizen.client.id"}, "", &out), 0);
    EXPECT_EQ(out, "s3cret\n");
    EXPECT_EQ(run_program({tool, "get", "absent"}), 1);
    EXPECT_EQ(run_program({tool, "--help"}, "", &out), 0);
    for (const char *args : {"", "get", "set", "get a b", "list", "get a/b"}) {
        std::string cmd = tool + " " + args + " 2>&1 </dev/null";
        EXPECT_EQ(run_program({"/bin/sh", "-c", cmd}, "", &out), 2) << cmd;
        EXPECT_EQ(std::count(out.begin(), out.end(), '\n'), 1) << out;
    }

    const struct {
        const char *path;
        mode_t mode;
        const char *reason;
    } cases[] = {
        {"keys/zuvo.tizen.client.id", 0644, "key storage file"},
        {"keys/zuvo.tizen.client.id", 0640, "key storage file"},
        {"keys", 0755, "key storage folder"},
        {"keys", 0701, "key storage folder"},
    };
    for (const auto &c : cases) {
        SCOPED_TRACE(c.mode);
        ASSERT_EQ(chmod(tmp.file(c.path).c_str(), c.mode), 0);
        got = nullptr;
        EXPECT_EQ(key_storage_get("zuvo.tizen.client.id", &got),
                  KEY_STORAGE_ERROR_PERMISSION_DENIED);
        EXPECT_EQ(got, nullptr);
        unlink(log.c_str());
        setenv("ZV_DLOG_FILE", log.c_str(), 1);
        EXPECT_EQ(run_program({"/bin/sh", "-c", tool + " get zuvo.tizen.client.id 2>&1"}, "", &out),
                  1);
        unsetenv("ZV_DLOG_FILE");
        EXPECT_NE(out.find("refused"), std::string::npos) << out;
        const std::string logged = read_file(log);
        EXPECT_NE(logged.find(std::string(c.reason) + " " + tmp.file(c.path)), std::string::npos)
            << logged;
        EXPECT_NE(logged.find("open to group or others"), std::string::npos);
        chmod(tmp.file(c.path).c_str(), c.path == std::string("keys") ? 0700 : 0600);
    }
}
