// skarn-mkcard: writes Skarn cards for tests, benchmarks and demos.
#include <CLI/CLI.hpp>

int main(int argc, char** argv) {
    CLI::App app{"skarn-mkcard: write a Skarn card folder tree"};
    app.set_version_flag("--version", std::string("skarn-mkcard ") + SKARN_VERSION);
    CLI11_PARSE(app, argc, argv);
    return 0;
}
