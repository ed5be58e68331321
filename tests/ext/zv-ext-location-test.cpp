// Tests of the location fix against the host location manager (ZV_LOCATION).
#include "zv-ext-location.h"

#include <gtest/gtest.h>
#include <stdlib.h>

// A fix is made for each request: each case is a request of its own.
TEST(LocationTest, PositionComesFromTheHostOrNotAtAll)
{
    const char *cases[][2] = {
        // ZV_LOCATION (nullptr: unset), "found latitude longitude"
        {" -33.86 , 151.21 ", "1 -33.86 151.21"},
        {"north,east", "0 0 0"},
        {"12.5", "0 0 0"},
        {"95.0,10.0", "0 0 0"},
        {"10.0,181.0", "0 0 0"},
        {nullptr, "0 0 0"},
    };
    for (const auto &c : cases) {
        c[0] ? setenv("ZV_LOCATION", c[0], 1) : unsetenv("ZV_LOCATION");
        double lat = -1.0, lon = -1.0;
        int found = zv_ext_location_get_pos(&lat, &lon);
        char text[64];
        snprintf(text, sizeof text, "%d %g %g", found, lat, lon);
        EXPECT_STREQ(text, c[1]) << (c[0] ? c[0] : "unset");
    }
}
