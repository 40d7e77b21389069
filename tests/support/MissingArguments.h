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

// What a query of the form (keys..., answer) with these parameters answers.
template <typename Keys, typename... Parameters>
using AnswerTo = std::remove_pointer_t<std::tuple_element_t<std::tuple_size_v<Keys>, std::tuple<Parameters...>>>;

// Expects the same of queries of that form.
template <typename Result, typename Keys, typename... Queries>
void expectNeed(Result expected, const Keys& keys, Queries... queries) {
    const auto need = [&]<typename... Parameters>(Result (*query)(Parameters...)) {
        AnswerTo<Keys, Parameters...> answer = {};
        std::apply([&](auto... key) { expectNeedsAll(expected, query, key..., &answer); }, keys);
    };
    (need(queries), ...);
}

#endif
