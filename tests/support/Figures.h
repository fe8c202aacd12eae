// How much a test does, and what it measured.
//
// Tests that draw at random or repeat themselves do VEMO_TEST_FACTOR times as much. VEMO_TEST_SEED changes
// what they draw. Both are whole numbers, 1 when they are not set.

#ifndef TESTS_FIGURES_H
#define TESTS_FIGURES_H

#include <cstdint>
#include <string>

int64_t scaled(int64_t nEveryday);

uint64_t seed();

// Prints the line "figure: NAME: TEXT", which scripts/test and scripts/stress collect.
void figure(const std::string& strName, const std::string& strText);

// "12.3 %", or "none" when the whole is 0.
std::string share(int64_t nPart, int64_t nWhole);

#endif
