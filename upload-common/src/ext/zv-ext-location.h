// Location fix: one position from the platform's location manager.
// Thread safety: main loop only (one process-wide manager handle per request).
#pragma once

// Sets both outputs to 0.0, then to the last known position; true when one was known.
int zv_ext_location_get_pos(double *latitude, double *longitude);
