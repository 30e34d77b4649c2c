// A calendar as a timeline of characters, as wide as the terminal, readable without colours.
#pragma once

#include "tasks/calendar.h"

namespace tavisched {

// Columns of the same length, by what clocks show, so that days are equally wide. With `hours` none
// is longer than an hour; what does not fit then follows below.
void printTimeline(const Calendar &calendar, bool hours);

} // namespace tavisched
