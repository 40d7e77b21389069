// Leaves out each pointer among the arguments of an operation in turn.
#ifndef VELTRA_TESTS_SUPPORT_MISSINGARGUMENTS_H
#define VELTRA_TESTS_SUPPORT_MISSINGARGUMENTS_H

#include <tuple>
#include <type_traits>
#include <utility>

#include <gtest/gtest.h>

template <std::size_t I, typename Result, typename Function, typename Arguments>
void expectWithout(Result expected, Function function, Arguments arguments) {
    using Argument = std::tuple_element_t<I, Arguments>;
    if constexpr (std::is_pointer_v<Argument> && !std::is_same_v<Argument, void*>) {
        std::get<I>(arguments) = nullptr;
        EXPECT_EQ(std::apply(function, arguments), expected) << "without argument " << I + 1;
    }
}

// Expects that `function` returns `expected` whichever of these arguments is null; contexts, which are void*, may be.
template <typename Result, typename... Parameters>
void expectNeedsAll(Result expected, Result (*function)(Parameters...), std::type_identity_t<Parameters>... arguments) {
    [&]<std::size_t... I>(std::index_sequence<I...>) {
        (expectWithout<I>(expected, function, std::tuple<Parameters...>(arguments...)), ...);
    }
    (std::index_sequence_for<Parameters...>());
}

#endif
