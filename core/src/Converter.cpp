#include "Converter.hpp"

namespace brenixcore
{

Converter::Converter(const std::string& converterPath)
    : impl(new Impl{loadPlugin<plugin::Converter, CouldNotLoadConverter, CouldNotCreateConverter>(
          converterPath)})
{
}

Converter::~Converter() = default;

} // namespace brenixcore
