#include "RoundTrip.h"

#include <vector>

namespace {

std::vector<std::string> splitLines(const std::string &text)
{
    std::vector<std::string> lines;
    size_t start = 0;
    while (start < text.size()) {
        const size_t end = text.find('\n', start);
        if (end == std::string::npos) {
            lines.push_back(text.substr(start));
            break;
        }
        lines.push_back(text.substr(start, end - start));
        start = end + 1;
    }
    return lines;
}

std::vector<std::string> words(const std::string &line)
{
    std::vector<std::string> result;
    std::string word;
    for (const char c : line) {
        if (c == ' ' || c == '\t') {
            if (!word.empty())
                result.push_back(word);
            word.clear();
        } else {
            word.push_back(c);
        }
    }
    if (!word.empty())
        result.push_back(word);
    return result;
}

std::string printed(const std::string &text, SyntaxMode mode)
{
    ConfigFile file(mode);
    file.parseText(text);
    return file.text();
}

} // namespace

std::string roundTripViolation(const std::string &input, SyntaxMode mode)
{
    const std::string output = printed(input, mode);
    if (!output.empty() && output.back() != '\n')
        return "output does not end with a newline";

    std::vector<std::string> in = splitLines(input);
    if (!in.empty() && input.back() != '\n' && words(in.back()).empty())
        in.pop_back();
    const std::vector<std::string> out = splitLines(output);
    if (in.size() != out.size())
        return "line count " + std::to_string(in.size()) + " became " + std::to_string(out.size());
    for (size_t i = 0; i < in.size(); ++i) {
        if (words(in[i]) != words(out[i]))
            return "line " + std::to_string(i + 1) + " \"" + in[i] + "\" printed as \"" + out[i] + "\"";
    }
    if (printed(output, mode) != output)
        return "printing is not idempotent";
    return {};
}
