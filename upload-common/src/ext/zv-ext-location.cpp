// Location fix: makes a location manager, asks it for the position it last knew, and
// destroys it again, once per request.
#include "zv-ext-location.h"

#include <locations.h>
#include <stddef.h>
#include <time.h>

#include "zv-log.h"

namespace
{

location_manager_h g_manager = nullptr;

} // namespace

static int _zv_ext_location_create(void)
{
    ZV_LOG_ENTER();
    int ret = location_manager_create(LOCATIONS_METHOD_HYBRID, &g_manager);
    if (ret != LOCATIONS_ERROR_NONE) {
        ZV_LOGE("create fail: %d", ret);
        g_manager = nullptr;
        return 0;
    }
    return 1;
}

static int _zv_ext_location_destroy(void)
{
    ZV_LOG_ENTER();
    if (!g_manager) {
        ZV_LOGE("handle is NULL");
        return 0;
    }
    int ret = location_manager_destroy(g_manager);
    g_manager = nullptr;
    if (ret != LOCATIONS_ERROR_NONE) {
        ZV_LOGE("destroy fail: %d", ret);
        return 0;
    }
    return 1;
}

int zv_ext_location_get_pos(double *latitude, double *longitude)
{
    ZV_LOG_ENTER();
    if (!latitude || !longitude) {
        ZV_LOGE("data is NULL");
        return 0;
    }
    *latitude = 0.0;
    *longitude = 0.0;

    if (!_zv_ext_location_create()) {
        ZV_LOGE("zv_ext_location_create fail");
        return 0;
    }

    double altitude = 0.0, lat = 0.0, lon = 0.0;
    time_t timestamp = 0;
    int ret = location_manager_get_position(g_manager, &altitude, &lat, &lon, &timestamp);
    if (ret != LOCATIONS_ERROR_NONE) {
        ZV_LOGE("get_position fail: %d", ret);
        _zv_ext_location_destroy();
        return 0;
    }
    *latitude = lat;
    *longitude = lon;
    _zv_ext_location_destroy();
    return 1;
}
