// Small helpers the host platform's modules share.
#pragma once

#include <string>

// Replaces the file at path with data, atomically: a reader sees the old content or the new,
// never a part. The new file has mode 0600. With durable, the data reaches the disk before the
// rename (for state that must survive a power failure; volatile state skips the cost).
// False on failure, with errno set; nothing is left behind.
bool zv_platform_replace_file(const std::string &path, const std::string &data, bool durable);
