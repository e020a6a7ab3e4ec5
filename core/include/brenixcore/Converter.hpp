/// @file
/// The converter of a channel.
#ifndef BRENIXCORE_CONVERTER_HPP
#define BRENIXCORE_CONVERTER_HPP

#include "brenixcore/Exceptions.hpp"

#include <memory>
#include <string>

namespace brenixcore
{

class Channel;

/// A loaded converter plug-in. Must outlive the channel that it is given to.
class BRENIXCORE_API Converter
{
public:
    /// Loads the plug-in and creates its converter. A path with a slash is used as it stands; a
    /// bare name is looked for in the plug-in folder.
    /// @throws CouldNotLoadConverter, CouldNotCreateConverter
    explicit Converter(const std::string& converterPath);
    Converter(const Converter&) = delete;
    Converter& operator=(const Converter&) = delete;
    ~Converter();

private:
    friend class Channel;
    struct Impl;
    std::unique_ptr<Impl> impl;
};

} // namespace brenixcore

#endif
