// Host location manager: the last known position is the one ZV_LOCATION names ("LAT,LON" in
// degrees), read at each request.
#include "locations.h"

#include <glib.h>
#include <stdlib.h>

#include <new>
#include <string>

#include "zv-log.h"

namespace
{

// Reads "LAT,LON"; false unless both are numbers in range.
bool parse_location(const char *text, double *latitude, double *longitude)
{
    gchar **parts = g_strsplit(text, ",", -1);
    bool ok = g_strv_length(parts) == 2;
    double values[2] = {0.0, 0.0};
    for (int i = 0; ok && i < 2; i++) {
        gchar *value = g_strstrip(parts[i]);
        gchar *end = nullptr;
        values[i] = g_ascii_strtod(value, &end);
        ok = *value && end && *end == '\0';
    }
    g_strfreev(parts);
    if (!ok || values[0] < -90.0 || values[0] > 90.0 || values[1] < -180.0 || values[1] > 180.0)
        return false;
    *latitude = values[0];
    *longitude = values[1];
    return true;
}

} // namespace

struct location_manager_s {
    location_method_e method;
};

int location_manager_create(location_method_e method, location_manager_h *manager)
{
    if (!manager)
        return LOCATIONS_ERROR_INVALID_PARAMETER;
    if (method < LOCATIONS_METHOD_HYBRID || method > LOCATIONS_METHOD_WPS)
        return LOCATIONS_ERROR_INCORRECT_METHOD;
    *manager = new (std::nothrow) location_manager_s{method};
    return *manager ? LOCATIONS_ERROR_NONE : LOCATIONS_ERROR_OUT_OF_MEMORY;
}

int location_manager_destroy(location_manager_h manager)
{
    if (!manager)
        return LOCATIONS_ERROR_INVALID_PARAMETER;
    delete manager;
    return LOCATIONS_ERROR_NONE;
}

int location_manager_get_position(location_manager_h manager, double *altitude, double *latitude,
                                  double *longitude, time_t *timestamp)
{
    if (!manager || !altitude || !latitude || !longitude || !timestamp)
        return LOCATIONS_ERROR_INVALID_PARAMETER;
    const char *env = getenv("ZV_LOCATION");
    if (!env || !*env)
        return LOCATIONS_ERROR_SERVICE_NOT_AVAILABLE;
    double lat = 0.0, lon = 0.0;
    if (!parse_location(env, &lat, &lon)) {
        ZV_LOGW("ZV_LOCATION \"%s\" is not LAT,LON in degrees", env);
        return LOCATIONS_ERROR_SERVICE_NOT_AVAILABLE;
    }
    *altitude = 0.0;
    *latitude = lat;
    *longitude = lon;
    *timestamp = time(nullptr);
    return LOCATIONS_ERROR_NONE;
}
