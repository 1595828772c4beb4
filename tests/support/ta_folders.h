// Which trusted applications a test finds, and the Keymaster among them.
#pragma once

#include <filesystem>
#include <string>

namespace keymaster::test {

// keymaster_file: the Keymaster under test: the one that $KEYMASTER_TEST_TA names, else the
// build's.
std::filesystem::path keymaster_file();

// use_ta_folders: the Keymaster under test, and all others from `folders`, separated by colons.
// use_own_tas: the others from the build.
void use_ta_folders(const std::string& folders);
void use_own_tas();

}  // namespace keymaster::test
