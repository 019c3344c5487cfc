#include "cli.h"

int main(int argc, char** argv) {
    return lumo::cli::RunLumo(argc, argv);
}
