// A command line of the tool, read once more: argument by argument, in plain comparisons.

#ifndef FUZZ_PLAIN_READING_H
#define FUZZ_PLAIN_READING_H

#include <map>
#include <string>
#include <vector>

#include "Command.h"

namespace fuzz {

typedef std::vector<std::string> Texts;

// The texts that each option and argument of a command is given, by its name; "" for a flag.
typedef std::map<std::string, Texts> Reading;

// What the command has read.
Reading readingOf(const tool::Command& command);

// What it should read from the arguments behind its name. Returns whether they can be read.
bool readPlainly(const tool::Command& command, const Texts& strArguments, Reading& reading);

} // namespace fuzz

#endif
