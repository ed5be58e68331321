// Tests of the location fix against the host location manager (ZV_LOCATION).
#include "zv-ext-location.h"

#include <gtest/gtest.h>
#include <stdlib.h>

#include "zv-test-util.h"

namespace
{

TEST(LocationTest, PositionComesFromTheHostOrNotAtAll)
{
    zv_test::TempDir dir;
    struct Case {
        const char *location; // nullptr: unset
        int found;
        double latitude, longitude;
    };
    const Case cases[] = {
        {"37.5665,126.978", 1, 37.5665, 126.978},
        {" -33.86 , 151.21 ", 1, -33.86, 151.21},
        {nullptr, 0, 0.0, 0.0},
        {"", 0, 0.0, 0.0},
        {"north,east", 0, 0.0, 0.0},
        {"12.5", 0, 0.0, 0.0},
        {"95.0,10.0", 0, 0.0, 0.0},
        {"10.0,181.0", 0, 0.0, 0.0},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.location ? c.location : "unset");
        if (c.location)
            setenv("ZV_LOCATION", c.location, 1);
        else
            unsetenv("ZV_LOCATION");
        // Two requests in a row each make and destroy their own manager.
        for (int round = 0; round < 2; round++) {
            double lat = -1.0, lon = -1.0;
            EXPECT_EQ(zv_ext_location_get_pos(&lat, &lon), c.found);
            EXPECT_DOUBLE_EQ(lat, c.latitude);
            EXPECT_DOUBLE_EQ(lon, c.longitude);
        }
    }
    unsetenv("ZV_LOCATION");
}

} // namespace
