#include "libkernel/core/DemangleTypeName.h"

#include <gtest/gtest.h>
#include <typeinfo>

namespace TestNames {

class Thing
{
};

template <class T>
struct Holder
{
    struct Inner
    {
    };
};

} // namespace TestNames

namespace {

using namespace Kernel;

TEST(DemangleTypeName, NamesAreForDisplay)
{
    using Nested = TestNames::Holder<TestNames::Thing>;
    struct Case
    {
        char const* name;
        char const* shown;
        char const* full;
    };
    for (Case const& c : {Case{typeid(int).name(), "int", "int"},
                          {typeid(TestNames::Thing).name(), "Thing", "TestNames::Thing"},
                          {typeid(Nested).name(), "Holder<TestNames::Thing>", "TestNames::Holder<TestNames::Thing>"},
                          {typeid(Nested::Inner).name(), "Inner", "TestNames::Holder<TestNames::Thing>::Inner"},
                          {"not mangled!", "not mangled!", "not mangled!"},
                          {"", "", ""}})
    {
        EXPECT_EQ(c.shown, DemangleTypeName(c.name, false)) << c.name;
        EXPECT_EQ(c.full, DemangleTypeName(c.name, true)) << c.name;
    }
    EXPECT_EQ("", DemangleTypeName(nullptr, true));
}

} // namespace
