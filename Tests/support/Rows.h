#pragma once

#include <initializer_list>
#include <tuple>

/// A table of cases, whose columns the structured binding of the loop over it names.
template <class... Columns>
using Rows = std::initializer_list<std::tuple<Columns...>>;
