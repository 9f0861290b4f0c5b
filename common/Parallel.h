#pragma once

#include <functional>

// Runs here on this thread and beside on a thread of its own, both to
// their end whatever either throws; then the first exception goes on.
// For the few passes over every user that split in two halves.
void onTwoThreads(const std::function<void()> &here, const std::function<void()> &beside);
