// Media library lookup: the thumbnail path and display name of a video file from the
// platform's media content database.
// Thread safety: main loop only.
#pragma once

int zv_ext_media_init(void);
int zv_ext_media_deinit(void);
// Looks file_path up among the videos. Each value found is handed out as a fresh copy that
// the caller frees; an output whose value is not found keeps what the caller put there
// (start from NULL). True also when nothing matched; false on a failure of the database
// (outputs untouched).
int zv_ext_media_get_thumb_info(const char *file_path, char **thumb_path, char **display_name);
