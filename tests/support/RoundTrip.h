#pragma once

#include "config/ConfigFile.h"

#include <string>

// The promise the configuration model makes for any input: printing a parsed
// file keeps every line with the same words in the same order (only blank
// runs may change width, indentation becomes tabs plus spaces, trailing
// blanks go, a last line gains its newline), and printing again changes
// nothing. Returns an empty string when the promise holds, otherwise what
// broke it. Plain C++ so the fuzz target can use it too.
std::string roundTripViolation(const std::string &input, SyntaxMode mode);
