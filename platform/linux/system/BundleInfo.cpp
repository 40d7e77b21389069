#include "platform/BundleInfo.h"

#include <filesystem>
#include <system_error>

#include <fcntl.h>

#include "platform/DeviceRoot.h"
#include "platform/PropertyList.h"

Value bundleInformationList() {
    constexpr std::size_t maximumSize = std::size_t{1} << 20;
    std::error_code error;
    const std::filesystem::path executable = std::filesystem::read_symlink("/proc/self/exe", error);
    if (error)
        return {};
    // The list comes with the program and not with the device, so it does not lie below the device root.
    const std::filesystem::path list = executable.parent_path() / "Info.plist";
    const FileDescriptor file(::open(list.c_str(), O_RDONLY | O_NONBLOCK | O_NOCTTY | O_CLOEXEC));
    const std::optional<Value::Data> contents = file ? readRegularFile(file, maximumSize) : std::nullopt;
    return contents ? propertyListToValue(*contents).value_or(Value()) : Value();
}
