// The seeds of slot_fuzzer: frames both ways, through slots and beside them, and then what is none.
#ifndef FUZZ_SLOT_SEEDS_H_
#define FUZZ_SLOT_SEEDS_H_

#include <string>
#include <utility>
#include <vector>

#include "fuzz/input_reader.h"

namespace fuzzing {

/// slot_seeds has a life of each side, for a channel that watches and for one that sleeps, with each of its ends.
[[nodiscard]] std::vector<std::pair<std::string, bytes>> slot_seeds();

}  // namespace fuzzing

#endif  // FUZZ_SLOT_SEEDS_H_
