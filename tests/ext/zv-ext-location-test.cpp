// Tests of the location fix against the host location manager (ZV_LOCATION).
#include "zv-ext-location.h"

#include <gtest/gtest.h>
#include <stdlib.h>

#include <string>

#include "zv-test-util.h"

TEST(LocationTest, PositionComesFromTheHostOrNotAtAll)
{
    zv_test::TempDir dir;
    const char *cases[][2] = {
        // ZV_LOCATION (nullptr: unset), "found latitude longitude"
        {"37.5665,126.978", "1 37.5665 126.978"},
        {" -33.86 , 151.21 ", "1 -33.86 151.21"},
        {nullptr, "0 0 0"},
        {"", "0 0 0"},
        {"north,east", "0 0 0"},
        {"12.5", "0 0 0"},
        {"95.0,10.0", "0 0 0"},
        {"10.0,181.0", "0 0 0"},
    };
    for (const auto &c : cases) {
        if (c[0])
            setenv("ZV_LOCATION", c[0], 1);
        else
            unsetenv("ZV_LOCATION");
        // Two requests in a row each make and destroy their own manager.
        for (int round = 0; round < 2; round++) {
            double lat = -1.0, lon = -1.0;
            int found = zv_ext_location_get_pos(&lat, &lon);
            char text[64];
            snprintf(text, sizeof text, "%d %g %g", found, lat, lon);
            EXPECT_EQ(std::string(text), c[1]) << (c[0] ? c[0] : "unset");
        }
    }
    unsetenv("ZV_LOCATION");
}
