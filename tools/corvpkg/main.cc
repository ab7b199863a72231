// corvpkg: the command line over libcorvpkg. It parses, calls the library and prints.
#include <cstdio>

int main() { return 0; }
