#pragma once

namespace skein {

// A program that was started with one of the descriptors 0 to 2 closed opens it on /dev/null:
// what it opens next would take the number, and be written or closed as if it were a
// terminal. Reading from it, or writing to it, fails as it would have. First thing in main. A
// system that has no /dev/null changes nothing.
void openStandardDescriptors();

// Lets go of the terminal, or of whatever else 0 to 2 are: they are /dev/null from now on.
void releaseStandardDescriptors();

}  // namespace skein
