// libFuzzer target: any bytes, in both syntaxes, must print back with every
// line's words intact and print identically a second time.
#include "RoundTrip.h"

#include <cstdint>
#include <cstdio>
#include <cstdlib>

extern "C" int LLVMFuzzerTestOneInput(const uint8_t *data, size_t size)
{
    const std::string input(reinterpret_cast<const char *>(data), size);
    for (const SyntaxMode mode : {SyntaxMode::KeyValue, SyntaxMode::TokenLine}) {
        const std::string violation = roundTripViolation(input, mode);
        if (!violation.empty()) {
            std::fprintf(stderr, "mode %d: %s\n", static_cast<int>(mode), violation.c_str());
            std::abort();
        }
    }
    return 0;
}
