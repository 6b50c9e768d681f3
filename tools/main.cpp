#include "Cli.h"

int main(int argc, char** argv) { return VeltoTool::Cli::main(argc, argv); }
