// glyphwell: the command-line tool for people and scripts.
#include <iostream>
#include <string>
#include <vector>

#include "tools/Commands.h"

int main(int argc, char** argv) {
    std::ios::sync_with_stdio(false);
    std::vector<std::string> arguments(argv + 1, argv + argc);
    return glyphwell::tools::RunTool(arguments, std::cin, std::cout, std::cerr);
}
