#pragma once

// The screen library without its macros, which have names such as clear and timeout.
#define NCURSES_NOMACROS 1
#include <curses.h>
