#ifndef BRENIXCODER_UTIL_HANDLE_HPP
#define BRENIXCODER_UTIL_HANDLE_HPP

#include <cstdint>

namespace brenixcoder
{

/// The base class that a handle points at. It begins with a mark of what kind of object it is.
class Marked
{
public:
    enum class Mark : uint32_t { None = 0, Channel = 0x6e616863, Stream = 0x6d727473 };

    Marked(const Marked&) = delete;
    Marked& operator=(const Marked&) = delete;

protected:
    explicit Marked(Mark ownMark) noexcept : mark(ownMark) {}

    /// Leaves no mark behind in the memory that is given back, by which a handle could still pass.
    ~Marked() { static_cast<volatile Mark&>(mark) = Mark::None; }

private:
    template <typename Object>
    friend Object* fromHandle(void* handle) noexcept;

    Mark mark;
};

/// The handle of an object, or null. Not the address of the object, which begins otherwise.
inline void* toHandle(Marked* object) noexcept
{
    return object;
}

/// The object of a handle; null for a null handle and for one of another kind of object.
template <typename Object>
Object* fromHandle(void* handle) noexcept
{
    auto* const marked = static_cast<Marked*>(handle);
    return marked != nullptr && marked->mark == Object::ownMark ? static_cast<Object*>(marked)
                                                                : nullptr;
}

} // namespace brenixcoder

#endif
