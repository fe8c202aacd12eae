// Reads a command line of the tool without getopt: argument by argument, with plain comparisons.

#ifndef FUZZ_PLAIN_READING_H
#define FUZZ_PLAIN_READING_H

#include <map>
#include <string>
#include <vector>

#include "Command.h"

namespace fuzz {

typedef std::vector<std::string> Texts;

// The texts given to each option and argument, by its name; "" for a flag.
typedef std::map<std::string, Texts> Reading;

// What the command has read.
Reading readingOf(const tool::Command& command);

// What the command should read from the arguments after its name. Returns whether they are valid.
bool readPlainly(const tool::Command& command, const Texts& strArguments, Reading& reading);

} // namespace fuzz

#endif
