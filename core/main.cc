#include "core/startup.h"

int main() { return ftcmd_main(); }
