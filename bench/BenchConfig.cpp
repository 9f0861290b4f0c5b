// Parses and prints a generated configuration of 100,000 lines and reports
// the best of several runs. Usage: benchconfig [lines] [runs]
#include "config/ConfigFile.h"

#include <algorithm>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <sstream>
#include <string>

namespace {

std::string generate(int lines)
{
    std::string text;
    text.reserve(static_cast<size_t>(lines) * 32);
    for (int i = 0; i < lines; ++i) {
        switch (i % 5) {
        case 0:
            text += "# comment line " + std::to_string(i) + "\n";
            break;
        case 1:
            text += "key_" + std::to_string(i) + "=YES\n";
            break;
        case 2:
            text += "\tindented_" + std::to_string(i) + " = /srv/ftp/" + std::to_string(i) + "\n";
            break;
        case 3:
            text += "auth\trequired\tpam_listfile.so item=user sense=deny file=/etc/ftpusers\n";
            break;
        default:
            text += "\n";
            break;
        }
    }
    return text;
}

double seconds(std::chrono::steady_clock::duration d)
{
    return std::chrono::duration<double>(d).count();
}

} // namespace

int main(int argc, char **argv)
{
    const int lines = argc > 1 ? std::atoi(argv[1]) : 100000;
    const int runs = argc > 2 ? std::atoi(argv[2]) : 5;
    const std::string text = generate(lines);

    double bestParse = 1e9;
    double bestPrint = 1e9;
    size_t printedBytes = 0;
    for (int run = 0; run < runs; ++run) {
        ConfigFile file(SyntaxMode::KeyValue);
        std::istringstream in(text);
        const auto t0 = std::chrono::steady_clock::now();
        file.parse(in);
        const auto t1 = std::chrono::steady_clock::now();
        const std::string out = file.text();
        const auto t2 = std::chrono::steady_clock::now();
        bestParse = std::min(bestParse, seconds(t1 - t0));
        bestPrint = std::min(bestPrint, seconds(t2 - t1));
        printedBytes = out.size();
    }
    std::printf("lines %d, bytes %zu, printed %zu\n", lines, text.size(), printedBytes);
    std::printf("parse %.1f ms, print %.1f ms (best of %d)\n", bestParse * 1e3, bestPrint * 1e3, runs);
    return 0;
}
