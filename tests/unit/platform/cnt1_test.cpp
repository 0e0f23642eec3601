// Module symbol loading, with the platform library itself as the module.
#include "cnt1/cnt1.h"

#include <gtest/gtest.h>
#include <stdlib.h>
#include <unistd.h>

#include <filesystem>
#include <string>

#include "anc1/anc1.h"

namespace {

std::string platformLibrary() {
    const char* bin = std::getenv("CSIT_BINARY_DIR");
    return std::string(bin != nullptr ? bin : ".") + "/lib/libplatform.so";
}

// Symbols are looked up by their linker names; the platform's functions
// have C++ linkage, so the test names them mangled.
TEST(Cnt1, ASymbolOfAModuleFoundByNameIsTheLoadedFunction) {
    void* addr = nullptr;
    // "platform" -> libplatform.so beside this library.
    ASSERT_EQ(CNT1_Load("platform", "_Z12ANC1_ReservePvPj", &addr), CNT1_OK) << CNT1_LastError();
    EXPECT_EQ(addr, reinterpret_cast<void*>(&ANC1_Reserve));
    // An upper-case module name found through CNT1_PATH (here a link to the
    // platform library named as the thru-node resolver's module would be).
    char tmpl[] = "/tmp/cnt1-test-XXXXXX";
    ASSERT_NE(mkdtemp(tmpl), nullptr);
    std::string dir = tmpl;
    std::filesystem::create_symlink(platformLibrary(), dir + "/libkfaprb.so");
    setenv("CNT1_PATH", ("/nonexistent:" + dir).c_str(), 1);
    ASSERT_EQ(CNT1_Load("KFAPRB", "_Z14CNT1_LastErrorv", &addr), CNT1_OK) << CNT1_LastError();
    EXPECT_EQ(addr, reinterpret_cast<void*>(&CNT1_LastError));
    // A path is taken as it is.
    ASSERT_EQ(CNT1_Load((dir + "/libkfaprb.so").c_str(), "_Z12ANC1_Releasej", &addr), CNT1_OK);
    EXPECT_EQ(addr, reinterpret_cast<void*>(&ANC1_Release));
    unsetenv("CNT1_PATH");
    std::filesystem::remove_all(dir);
}

TEST(Cnt1, MissingModulesAndSymbolsFailWithAReason) {
    void* addr = reinterpret_cast<void*>(1);
    EXPECT_EQ(CNT1_Load("NOSUCHMODULE", "KFARSVTN", &addr), CNT1_NOMODULE);
    EXPECT_EQ(addr, nullptr);
    EXPECT_NE(std::string(CNT1_LastError()).find("NOSUCHMODULE"), std::string::npos);
    addr = reinterpret_cast<void*>(1);
    EXPECT_EQ(CNT1_Load("platform", "CNT1_NOSUCHSYMBOL", &addr), CNT1_NOSYMBOL);
    EXPECT_EQ(addr, nullptr);
    EXPECT_NE(std::string(CNT1_LastError()).find("CNT1_NOSUCHSYMBOL"), std::string::npos);
    EXPECT_EQ(CNT1_Load("", "x", &addr), CNT1_BADARG);
    EXPECT_EQ(CNT1_Load("platform", nullptr, &addr), CNT1_BADARG);
    EXPECT_EQ(CNT1_Load("platform", "x", nullptr), CNT1_BADARG);
}

}  // namespace
