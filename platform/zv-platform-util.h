// Small helpers the host platform's modules share.
#pragma once

#include <string>

// Replaces the file at path with data, atomically: a reader sees the old content or the new,
// never a part. The new file has mode 0600. With durable, the data reaches the disk before the
// rename (for state that must survive a power failure; volatile state skips the cost).
// False on failure, with errno set; nothing is left behind.
bool zv_platform_replace_file(const std::string &path, const std::string &data, bool durable);

// Paths. The folder of the running program, without a trailing '/' (empty when unknown).
std::string zv_platform_exe_dir();
// path taken from the current directory when relative.
std::string zv_platform_absolute(const std::string &path);
// path with one trailing '/'.
std::string zv_platform_with_slash(std::string path);
// The application's resource folder, ending in '/': $ZV_RES_DIR, else the build tree's when
// run from it, else the one installed beside the program, else the configured prefix's.
std::string zv_platform_resource_dir();
