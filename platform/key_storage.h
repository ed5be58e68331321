// Key storage: named secrets in files under $ZV_KEY_STORAGE_DIR, readable by the owner only.
#pragma once

#ifdef __cplusplus
extern "C" {
#endif

typedef enum {
    KEY_STORAGE_ERROR_NONE = 0,
    KEY_STORAGE_ERROR_INVALID_PARAMETER = -22,
    KEY_STORAGE_ERROR_NO_DATA = -61,
    KEY_STORAGE_ERROR_PERMISSION_DENIED = -13,
    KEY_STORAGE_ERROR_IO = -5,
} key_storage_error_e;

// 0 and a new text in *value (the caller frees it), or a key_storage_error_e. An entry whose
// file or folder can be read by group or others is refused (and the reason logged).
int key_storage_get(const char *name, char **value);
// Writes an entry (folder 0700, file 0600), replacing it atomically.
int key_storage_set(const char *name, const char *value);

#ifdef __cplusplus
}
#endif
