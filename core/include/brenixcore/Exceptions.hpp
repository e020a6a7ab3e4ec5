/// @file
/// The exceptions by which the core says what went wrong. Each carries a message that names the
/// thing at fault; every other failure is a plain std::exception.
#ifndef BRENIXCORE_EXCEPTIONS_HPP
#define BRENIXCORE_EXCEPTIONS_HPP

#include <stdexcept>

/// Classes that pass between the modules of a process.
#define BRENIXCORE_API __attribute__((visibility("default")))

namespace brenixcore
{

/// The device plug-in could not be loaded.
class BRENIXCORE_API CouldNotLoadDevice : public std::runtime_error
{
public:
    using std::runtime_error::runtime_error;
};

/// The converter plug-in could not be loaded.
class BRENIXCORE_API CouldNotLoadConverter : public std::runtime_error
{
public:
    using std::runtime_error::runtime_error;
};

/// A filter plug-in could not be loaded.
class BRENIXCORE_API CouldNotLoadFilter : public std::runtime_error
{
public:
    using std::runtime_error::runtime_error;
};

/// The device plug-in was loaded, but its device could not be created.
class BRENIXCORE_API CouldNotCreateDevice : public std::runtime_error
{
public:
    using std::runtime_error::runtime_error;
};

/// The converter plug-in was loaded, but its converter could not be created.
class BRENIXCORE_API CouldNotCreateConverter : public std::runtime_error
{
public:
    using std::runtime_error::runtime_error;
};

/// A filter plug-in was loaded, but its filter could not be created.
class BRENIXCORE_API CouldNotCreateFilter : public std::runtime_error
{
public:
    using std::runtime_error::runtime_error;
};

/// The counts asked for cannot be had, ever or in time. The data stays buffered.
class BRENIXCORE_API SynchronousInputNotPossible : public std::runtime_error
{
public:
    using std::runtime_error::runtime_error;
};

/// The data cannot be taken, ever or in time. Nothing of it was.
class BRENIXCORE_API SynchronousOutputNotPossible : public std::runtime_error
{
public:
    using std::runtime_error::runtime_error;
};

/// The converter failed on input data.
class BRENIXCORE_API CouldNotConvertInputData : public std::runtime_error
{
public:
    using std::runtime_error::runtime_error;
};

/// The converter failed on output data.
class BRENIXCORE_API CouldNotConvertOutputData : public std::runtime_error
{
public:
    using std::runtime_error::runtime_error;
};

/// A filter was added while the channel is open.
class BRENIXCORE_API CannotAddFilterWhileOpen : public std::runtime_error
{
public:
    using std::runtime_error::runtime_error;
};

} // namespace brenixcore

#endif
