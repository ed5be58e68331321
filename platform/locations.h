// Location manager: the last position the host knows, from ZV_LOCATION="LAT,LON" (degrees).
// Without it, or with a value that is not two numbers in range, no position is known.
// Thread safety: any thread; a handle is used by one thread at a time.
#pragma once

#include <time.h>

#ifdef __cplusplus
extern "C" {
#endif

typedef struct location_manager_s *location_manager_h;

typedef enum {
    LOCATIONS_ERROR_NONE = 0,
    LOCATIONS_ERROR_OUT_OF_MEMORY = -12,
    LOCATIONS_ERROR_INVALID_PARAMETER = -22,
    LOCATIONS_ERROR_ACCESSIBILITY_NOT_ALLOWED = -13,
    LOCATIONS_ERROR_NOT_SUPPORTED = -0x01100000 | 0x02,
    LOCATIONS_ERROR_INCORRECT_METHOD = -0x02C00000 | 0x01,
    LOCATIONS_ERROR_NETWORK_FAILED = -0x02C00000 | 0x02,
    LOCATIONS_ERROR_SERVICE_NOT_AVAILABLE = -0x02C00000 | 0x03,
    LOCATIONS_ERROR_GPS_SETTING_OFF = -0x02C00000 | 0x04,
} location_error_e;

typedef enum {
    LOCATIONS_METHOD_NONE = -1,
    LOCATIONS_METHOD_HYBRID = 0,
    LOCATIONS_METHOD_GPS = 1,
    LOCATIONS_METHOD_WPS = 2,
} location_method_e;

int location_manager_create(location_method_e method, location_manager_h *manager);
int location_manager_destroy(location_manager_h manager);
// The last known position: altitude 0 (unknown on this host), latitude and longitude in
// degrees, the time of the answer. SERVICE_NOT_AVAILABLE when no position is known.
int location_manager_get_position(location_manager_h manager, double *altitude, double *latitude,
                                  double *longitude, time_t *timestamp);

#ifdef __cplusplus
}
#endif
