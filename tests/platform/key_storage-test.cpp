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

// Entries are made private and read back (an empty one and one that ends with a newline too;
// a plain one written by the tool and read by the service: the e2e tests); the tool, another
// process, keeps them, refuses open ones and says why in the log and in its one-line answer,
// and answers wrong calls with 2.
TEST(KeyStorage, PrivateEntriesReadBackAndOpenOnesAreRefused)
{
    TempDir tmp;
    for (const char *v : {"", "ends with newline\n"}) {
        ASSERT_EQ(key_storage_set("zuvo.tizen.api.key", v), KEY_STORAGE_ERROR_NONE);
        char *got = nullptr;
        ASSERT_EQ(key_storage_get("zuvo.tizen.api.key", &got), KEY_STORAGE_ERROR_NONE);
        EXPECT_STREQ(got, v);
        free(got);
    }
    struct stat folder, file;
    ASSERT_EQ(stat(tmp.file("keys").c_str(), &folder), 0);
    ASSERT_EQ(stat(tmp.file("keys/zuvo.tizen.api.key").c_str(), &file), 0);
    EXPECT_EQ(folder.st_mode & 0777, 0700u);
    EXPECT_EQ(file.st_mode & 0777, 0600u);
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
    EXPECT_EQ(wrong_calls(tool, {"", "get", "set", "get a b", "list", "get a/b"}), "");

    // Open to the group, to others.
    const std::pair<const char *, mode_t> cases[] = {{"keys/zuvo.tizen.client.id", 0640},
                                                     {"keys", 0701}};
    for (const auto &[path, mode] : cases) {
        SCOPED_TRACE(path);
        ASSERT_EQ(chmod(tmp.file(path).c_str(), mode), 0);
        std::string cmd = "ZV_DLOG_FILE=" + log + " " + tool + " get zuvo.tizen.client.id 2>&1";
        EXPECT_EQ(run_program({"/bin/sh", "-c", cmd}, "", &out), 1);
        EXPECT_NE(out.find("refused"), std::string::npos) << out;
        const std::string logged = read_file(log);
        const std::string reason =
            path == std::string("keys") ? "key storage folder " : "key storage file ";
        EXPECT_NE(logged.find(reason + tmp.file(path) + " is open to group or others"),
                  std::string::npos)
            << logged;
        unlink(log.c_str());
        chmod(tmp.file(path).c_str(), mode == 0701 ? 0700 : 0600);
    }
}
