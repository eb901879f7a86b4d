#include "libkernel/core/DemangleTypeName.h"

#include <gtest/gtest.h>
#include <tuple>
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
    using Row = std::tuple<char const*, char const*, char const*>;
    for (auto const& [name, shown, full] :
         {Row{typeid(int).name(), "int", "int"}, Row{typeid(TestNames::Thing).name(), "Thing", "TestNames::Thing"},
          Row{typeid(Nested).name(), "Holder<TestNames::Thing>", "TestNames::Holder<TestNames::Thing>"},
          Row{typeid(Nested::Inner).name(), "Inner", "TestNames::Holder<TestNames::Thing>::Inner"},
          Row{"not mangled!", "not mangled!", "not mangled!"}, Row{"", "", ""}})
    {
        EXPECT_EQ(shown, DemangleTypeName(name, false)) << name;
        EXPECT_EQ(full, DemangleTypeName(name, true)) << name;
    }
    EXPECT_EQ("", DemangleTypeName(nullptr, true));
}

} // namespace
