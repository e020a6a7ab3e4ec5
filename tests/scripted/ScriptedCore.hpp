// A core that tests script. It keeps a log of every call as text, runs the hook that a test set for
// the operation, which may throw or raise events, and answers with what the test put into `core`.
#ifndef BRENIXCODER_TESTS_SCRIPTED_SCRIPTEDCORE_HPP
#define BRENIXCODER_TESTS_SCRIPTED_SCRIPTEDCORE_HPP

#include "brenixcore/Channel.hpp"

#include <functional>
#include <map>
#include <string>
#include <utility>
#include <vector>

namespace scripted
{

struct Core {
    std::vector<std::string> log;
    std::map<std::string, std::function<void()>, std::less<>> on; ///< hooks by operation
    bool hasInput = true;
    bool hasOutput = true;
    bool flag = false;        ///< what isOpen() and isDeviceDone() answer
    unsigned long number = 0; ///< what the other queries and write() answer
    bool unlimited = false;
    std::vector<unsigned long> counts; ///< what peekCounts() lists
    std::vector<void*> delivery;       ///< what read() hands over
    brenixcore::Channel::IEventHandler* handler = nullptr;
    brenixplugin::PropertyMap* properties = nullptr; ///< the store; for hooks of init
};

inline Core core;

/// Adds to the log; on any thread.
void log(std::string entry);

/// Which allocation from now on fails on this thread: 1 is the next, 0 is none.
inline thread_local long failingAllocation = 0;

/// Exempts the core and the tests themselves from failing allocations.
class AllocationsAllowed
{
public:
    AllocationsAllowed() : suspended(std::exchange(failingAllocation, 0)) {}
    ~AllocationsAllowed() { failingAllocation = suspended; }

private:
    long suspended;
};

/// Calls visit(type name, a T) for the eleven numeric and logical types.
template <typename Visitor>
void forEachType(Visitor visit)
{
    visit("double", double());
    visit("logical", bool());
    visit("uint8", static_cast<unsigned char>(0));
    visit("int8", static_cast<signed char>(0));
    visit("uint64", 0UL);
    visit("int64", 0L);
    visit("uint32", 0U);
    visit("int32", 0);
    visit("uint16", static_cast<unsigned short>(0));
    visit("int16", static_cast<short>(0));
    visit("float", float());
}

} // namespace scripted

#endif
