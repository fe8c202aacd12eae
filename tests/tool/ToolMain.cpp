// The tool's main function under another name, for a program that has one already.

#define main toolMain
#include "../../tools/main.cpp"
