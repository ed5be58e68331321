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

TEST(KeyStorage, SetMakesPrivateEntriesThatReadBack)
{
    TempDir tmp;
    ASSERT_EQ(key_storage_set("zuvo.tizen.api.key", "AIza-secret"), KEY_STORAGE_ERROR_NONE);
    struct stat sb;
    ASSERT_EQ(stat(tmp.file("keys").c_str(), &sb), 0);
    EXPECT_EQ(sb.st_mode & 0777, 0700u);
    ASSERT_EQ(stat(tmp.file("keys/zuvo.tizen.api.key").c_str(), &sb), 0);
    EXPECT_EQ(sb.st_mode & 0777, 0600u);

    const char *values[] = {"AIza-secret", "", "ends with newline\n"};
    for (const char *v : values) {
        ASSERT_EQ(key_storage_set("k", v), KEY_STORAGE_ERROR_NONE);
        char *got = nullptr;
        ASSERT_EQ(key_storage_get("k", &got), KEY_STORAGE_ERROR_NONE);
        EXPECT_STREQ(got, v);
        free(got);
    }
    char *got = reinterpret_cast<char *>(1);
    EXPECT_EQ(key_storage_get("absent", &got), KEY_STORAGE_ERROR_NO_DATA);
    EXPECT_EQ(got, nullptr);
    EXPECT_EQ(key_storage_get("../keys/k", &got), KEY_STORAGE_ERROR_INVALID_PARAMETER);
}

TEST(KeyStorage, OpenFileOrFolderIsRefusedWithReason)
{
    TempDir tmp;
    std::string log = tmp.file("dlog");
    ASSERT_EQ(key_storage_set("zuvo.tizen.client.id", "id"), KEY_STORAGE_ERROR_NONE);
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
        chmod(tmp.file(c.path).c_str(), c.mode);
        char *got = nullptr;
        EXPECT_EQ(key_storage_get("zuvo.tizen.client.id", &got),
                  KEY_STORAGE_ERROR_PERMISSION_DENIED)
            << c.path << " " << std::oct << c.mode;
        EXPECT_EQ(got, nullptr);

        // The tool says why, in the log and in its one-line answer.
        unlink(log.c_str());
        setenv("ZV_DLOG_FILE", log.c_str(), 1);
        std::string out;
        EXPECT_EQ(run_program(
                      {"/bin/sh", "-c", bin_path("zv-keystore") + " get zuvo.tizen.client.id 2>&1"},
                      "", &out),
                  1);
        unsetenv("ZV_DLOG_FILE");
        EXPECT_NE(read_file(log).find(std::string(c.reason) + " " + tmp.file(c.path)),
                  std::string::npos)
            << read_file(log);
        EXPECT_NE(read_file(log).find("open to group or others"), std::string::npos);
        EXPECT_NE(out.find("refused"), std::string::npos) << out;
        chmod(tmp.file(c.path).c_str(), c.path == std::string("keys") ? 0700 : 0600);
    }
}

TEST(KeyStorageTool, SetGetAndWrongCalls)
{
    TempDir tmp;
    std::string tool = bin_path("zv-keystore");
    std::string out;
    ASSERT_EQ(run_program({tool, "set", "zuvo.tizen.client.secret"}, "s3cret\n"), 0);
    ASSERT_EQ(run_program({tool, "get", "zuvo.tizen.client.secret"}, "", &out), 0);
    EXPECT_EQ(out, "s3cret\n");
    EXPECT_EQ(run_program({tool, "get", "absent"}), 1);
    const std::vector<std::string> wrong = {"", "get", "set", "get a b", "list", "get a/b"};
    for (const auto &args : wrong) {
        std::string cmd = tool + " " + args + " 2>&1 </dev/null";
        EXPECT_EQ(run_program({"/bin/sh", "-c", cmd}, "", &out), 2) << cmd;
        EXPECT_EQ(std::count(out.begin(), out.end(), '\n'), 1) << out;
    }
    EXPECT_EQ(run_program({tool, "--help"}, "", &out), 0);
}
