// System notifications: the ongoing notification "zuvo_ongoing_noti" (progress and count,
// opens this application when tapped), the completion notification "zuvo_complete_noti"
// (opens nothing) and the one-line status message. Both notifications are found again by
// their tags, so a later process can update or remove what an earlier one posted.
// Arguments are borrowed. Thread safety: main loop only.
#pragma once

// progress: a fraction from 0.0 to 1.0; a negative value leaves the progress unset.
// current / total: the count text "[current/total]" when total > 1, else "".
// Removes any ongoing notification first; true when the new one was posted.
int zuvo_ext_noti_ongoing_noti_create(const char *title_text, const char *sub_txt, int current,
                                      int total, double progress);
// Updates the posted ongoing notification, or creates one when none is posted.
void zuvo_ext_noti_ongoing_noti_update(const char *title_text, const char *sub_txt, int current,
                                       int total, double progress);
void zuvo_ext_noti_ongoing_noti_destroy(void);
// Removes the ongoing notification, releases the previous completion handle and posts a new
// completion notification; true when posted.
int zuvo_ext_noti_complete_noti_create(const char *title_text, const char *sub_txt);
// Releases the completion handle; the posted notification stays in the tray.
void zuvo_ext_noti_complete_noti_destroy(void);
void zuvo_ext_noti_message_post(const char *message);
