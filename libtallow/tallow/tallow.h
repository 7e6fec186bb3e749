#pragma once

// The client library of tallowsearchd. Needs C++20.
#include <tallow/Client.h>
