// Waiting for what happens soon.
#ifndef TESTS_SUPPORT_EVENTUALLY_H_
#define TESTS_SUPPORT_EVENTUALLY_H_

#include <functional>

namespace testing_support {

/// eventually tries again and again, for at most ten seconds, until `holds`.
bool eventually(const std::function<bool()>& holds);

}  // namespace testing_support

#endif  // TESTS_SUPPORT_EVENTUALLY_H_
