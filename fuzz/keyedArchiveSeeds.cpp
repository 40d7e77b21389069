#include "fuzz/Seeds.h"
#include "platform/KeyedArchive.h"

int main(int count, char** arguments) {
    const Value everything = Value::Dictionary{
        {"array", Value::Array{1, -1, 256, 1 << 20, std::int64_t{1} << 40, true, false}},
        {"data", Value::Data(300, 0x55)},
        {"text", "Gerät"},
        {"empty", Value::Array{Value::Dictionary{}, Value::Array{}, Value::Data{}, ""}},
    };
    Value nested = 1;
    for (int i = 0; i < 31; ++i)
        nested = Value::Array{std::move(nested)};
    return writeSeeds(count, arguments,
                      {archiveEncode("k", everything), archiveEncode("k", nested), archiveEncode("k", 7)});
}
