// Random sequences of calls over several channels. Each call is compared with a model of what lasts
// from one call to the next: the error records, the handles, the stored buffers, the properties, and
// which property objects are alive. What a call makes of its arguments is in the tables of the other
// tests.

#include "Calls.hpp"
#include "Soak.hpp"
#include "scripted/ChannelFixture.hpp"

#include <optional>
#include <random>

using namespace scripted;

namespace
{

using Fields = std::map<std::string, int>; ///< objects of the core, each an int32
using Store = std::vector<std::optional<Fields>>;

struct StreamModel {
    bool isInput;
    void* handle = nullptr;
    bool supported = false, isNew = false;
    Store store = {};
};

struct ChannelModel {
    Core core; ///< stands in the global one while the channel is called
    void* handle = nullptr;
    StreamModel input{true}, output{false};
    std::vector<StreamModel> old;                    ///< the streams of earlier inits
    std::string last = "|", sync = "|", async = "|"; ///< "identifier|message"
    Fields properties;
};

/// Leaves the model of a call, which must fail and leave this last error.
struct Failure {
    std::string error;
};

void require(bool condition, const std::string& error)
{
    condition ? void() : throw Failure{error};
}

class Sequence
{
public:
    explicit Sequence(uint64_t seed) : random(seed) {}

    /// Makes calls, and destroys all channels. Returns how many calls there were.
    uint64_t run()
    {
        using S = Sequence;
        constexpr void (Sequence::*steps[])() = {
            &S::init,     &S::passing, &S::passing, &S::passing,   &S::passing,
            &S::property, &S::errors,  &S::errors,  &S::happening, &S::read,
            &S::read,     &S::field,   &S::field,   &S::free,      &S::destroy};
        while (calls < 200 && !testing::Test::HasFailure()) {
            const std::size_t step = pick(std::size(steps));
            SCOPED_TRACE("call " + std::to_string(calls) + ", step " + std::to_string(step));
            visit(channels[pick(std::size(channels))], steps[step]);
        }
        for (ChannelModel& channel : channels) {
            channel.handle != nullptr ? visit(channel, &S::destroy) : void();
        }
        return calls;
    }

private:
    std::size_t pick(std::size_t count) { return random() % count; }
    bool rarely() { return pick(12) == 0; }
    template <typename T>
    T anyOf(std::initializer_list<T> values)
    {
        return values.begin()[pick(values.size())];
    }
    std::string anyName() { return anyOf({"a", "a1", "b", "b-1", ""}); }
    int anyIndex() { return anyOf({1, 1, 2, 3, 0, -1, INT_MIN, INT_MAX}); }

    void visit(ChannelModel& channel, void (Sequence::*step)())
    {
        c = &channel;
        std::swap(core, c->core);
        core.flag = pick(2) == 1;
        core.unlimited = rarely();
        core.number = anyOf({0UL, 1UL, (1UL << 53) + 1, ULONG_MAX});
        (this->*(c->handle == nullptr ? &Sequence::create : step))();
        std::swap(core, c->core);
        compareChannels();
    }

    // Property objects of the core.

    void make(PropertyMap& objects, Fields& fields)
    {
        for (const char* name : {"a", "b", "b-1"}) {
            if (pick(3) > 0) {
                objects[name] = scalar(name, fields[name] = static_cast<int>(pick(100)));
            }
        }
    }

    void expectRelease(const Fields& fields)
    {
        for (const auto& field : fields) {
            expected.push_back("destroy(" + field.first + ")");
        }
    }

    void expectRelease(const Store& buffers)
    {
        for (const auto& buffer : buffers) {
            expectRelease(buffer.value_or(Fields()));
        }
    }

    // What the core is to see, and what then may happen in it: a failure, or what plug-ins do.

    void expectCore(const std::string& operation, const std::string& side = "")
    {
        expected.push_back(side + operation + "(");
        if (!rarely()) {
            return;
        }
        std::function<void()>& hook = core.on[operation];
        switch (pick(5)) {
        case 0:
            hook = [] { throw brenixcore::CannotAddFilterWhileOpen("text"); };
            throw Failure{"brenix:Stream:cannotAddFilterWhileOpen|"};
        case 1:
            hook = [] { throw std::runtime_error("text"); };
            throw Failure{unexpected + "text"};
        case 2:
            return expectUpdate(hook);
        default:
            return expectEvent(hook);
        }
    }

    void expectStream(const StreamModel& stream, const std::string& operation)
    {
        require(stream.supported, notSupported(stream.isInput));
        expectCore(operation, stream.isInput ? "input." : "output.");
    }

    void expectUpdate(std::function<void()>& update)
    {
        const std::string name = anyName();
        const int value = static_cast<int>(pick(100));
        const auto stored = c->properties.find(name);
        const bool known = stored != c->properties.end();
        expected.push_back("destroy(" + name + ")");
        known ? void(stored->second = value) : void();
        update = somewhere([=] {
            IPropertyInfo* const property = scalar(name, value);
            core.handler->onPropertyUpdate(property);
            brenixplugin::OwnedProperty stays(known ? nullptr : property);
        });
    }

    void expectEvent(std::function<void()>& event)
    {
        const std::string name = anyOf({"error", "error", "errorMessage", "warning",
                                        "warningMessage", "trace", "traceMessage", "Error", ""});
        const std::string identifier = anyOf({"", "i"});
        event = somewhere([=] { raiseEvent(name, identifier, "m"); });
        if (name == "error") {
            expected.emplace_back("getMessage()");
        }
        if (!name.empty() && name != "Error") {
            expected.emplace_back("accept()");
        }
        if (name.starts_with("error")) {
            const auto* const fixed = "Array-based errors are not yet supported in Zelkor";
            (elsewhere ? c->async : c->sync) = identifier + "|" + (name == "error" ? "m" : fixed);
            require(elsewhere, "|");
        }
    }

    std::function<void()> somewhere(const std::function<void()>& what)
    {
        elsewhere = pick(2) == 1;
        return elsewhere ? [=] { std::thread(what).join(); } : what;
    }

    // Calls and comparisons.

    /// Makes a call with a handle, or now and then with none or one of the other kind, and compares
    /// its result.
    template <typename Model, typename Function>
    void call(void* handle, const Model& model, const Function& function)
    {
        const bool isWrong = rarely();
        if (isWrong) {
            handle = anyOf(
                {static_cast<void*>(nullptr), handle == c->handle ? c->input.handle : c->handle});
        }
        bool result = handle != nullptr && !isWrong;
        try {
            if (result) {
                c->last = "|";
                model();
            }
        } catch (const Failure& failure) {
            c->last = failure.error;
            result = false;
        }
        EXPECT_EQ(function(handle), result);
        compareLog();
    }

    /// The core has seen what it was to see, with any arguments.
    void compareLog()
    {
        const auto log = std::exchange(core.log, {});
        const auto begins = [](const auto& seen, const auto& start) {
            return seen.starts_with(start);
        };
        EXPECT_TRUE(std::equal(log.begin(), log.end(), expected.begin(), expected.end(), begins))
            << testing::PrintToString(log) << testing::PrintToString(expected);
        expected.clear();
        core.on.clear();
        ++calls;
    }

    void compareChannels()
    {
        std::size_t objects = 0;
        for (const ChannelModel& channel : channels) {
            objects += channel.properties.size();
            for (const auto& buffer : channel.input.store) {
                objects += buffer.value_or(Fields()).size();
            }
            if (channel.handle != nullptr) {
                EXPECT_EQ(record(channel.handle, coderChannelGetLastError), channel.last);
            }
        }
        EXPECT_EQ(liveProperties, objects);
    }

    // The functions.

    void create()
    {
        core = {};
        expected = {"Converter(c)", "Channel(d, 1, 1)"};
        c->handle = coderChannelCreate("d", "c", id, message, 1, 1);
        compareLog();
    }

    void destroy()
    {
        expectRelease(c->properties);
        expectRelease(c->input.store);
        expected.insert(expected.end(), {"~Channel()", "~Converter()"});
        coderChannelDestroy(c->handle);
        compareLog();
        *c = ChannelModel();
    }

    void init()
    {
        core.hasStreams = !rarely();
        const auto model = [&] {
            expectCore("init");
            c->input.supported = c->output.supported = false;
            for (StreamModel* s : {&c->input, &c->output}) {
                expectCore(s->isInput ? "getInputStream" : "getOutputStream");
                expectRelease(std::exchange(s->store, {}));
                if (s->handle != nullptr) {
                    c->old.push_back(*s);
                }
                s->supported = core.hasStreams;
                s->isNew = true;
            }
        };
        call(c->handle, model, [](void* handle) { return coderChannelInit(handle, 0); });
        compareChannels();
        if (c->output.isNew && c->properties.empty()) {
            make(*core.properties, c->properties);
        }
        for (StreamModel* s : {&c->input, &c->output}) {
            void* const handle = s->isInput ? coderChannelGetInputStream(c->handle)
                                            : coderChannelGetOutputStream(c->handle);
            EXPECT_EQ(std::exchange(s->handle, handle) != handle, std::exchange(s->isNew, false));
            EXPECT_EQ(coderStreamGetChannel(handle), handle == nullptr ? nullptr : c->handle);
            uint8_t supported = 0;
            coderStreamIsSupported(handle, &supported);
            EXPECT_EQ(supported == 1, s->supported);
        }
        c->last = "|";
    }

    StreamModel& anyStream() { return pick(2) == 1 ? mostlyInput() : c->output; }
    StreamModel& mostlyInput()
    {
        if (rarely()) {
            return c->old.empty() ? c->output : c->old[pick(c->old.size())];
        }
        return c->input;
    }

    /// A call that passes on to the core, and leaves behind only what happens there.
    void passing()
    {
        const Call& row = table.rows[pick(table.rows.size())];
        if (row.operation.empty() || row.operation == "init" || row.operation == "read") {
            return;
        }
        const StreamModel& s = anyStream();
        Buffer answer(sizeof(double));
        std::string bytes(row.resets() ? sizeof(double) : 0, '\0');
        const auto model = [&] {
            if (row.target == Channels) {
                expectCore(row.operation);
            } else {
                const bool isInput = row.target == Streams ? s.isInput : row.target == Inputs;
                require(isInput == s.isInput, notSupported(isInput));
                if (row.argument == "space") {
                    expectStream(s, "isUnlimited");
                }
                if (row.argument != "space" || !core.unlimited) {
                    expectStream(s, row.operation);
                }
            }
            const double number = row.argument == "totalCounts"               ? 0
                                  : row.argument == "space" && core.unlimited ? INFINITY
                                                                              : double(core.number);
            if (row.argument == "open" || row.argument == "done") {
                bytes = bytesOf(&core.flag, 1);
            } else if (!row.argument.empty()) {
                bytes = bytesOf(&number, 1);
            }
        };
        call(row.target == Channels ? c->handle : s.handle, model,
             [&](void* handle) { return row.run(handle, answer.data()); });
        EXPECT_EQ(answer.written(), bytes);
    }

    void property()
    {
        const std::string name = anyName();
        Buffer to(sizeof(int));
        std::string bytes;
        const auto model = [&] {
            const auto found = c->properties.find(name);
            require(found != c->properties.end(),
                    unexpected + "Custom property: " + name + " not found.");
            bytes = bytesOf(&found->second, 1);
        };
        call(c->handle, model, [&](void* handle) {
            return coderChannelGetPropertyValue(handle, name.c_str(), "int32", 1, to.data());
        });
        EXPECT_EQ(to.written(), bytes);
    }

    void errors()
    {
        const auto expectHas = [&](auto* function, const std::string& error) {
            uint8_t answer = 2;
            EXPECT_EQ(function(c->handle, &answer), 1);
            EXPECT_EQ(answer, error.front() != '|');
        };
        switch (pick(4)) {
        case 0:
            return expectHas(coderChannelHasSyncError, c->sync);
        case 1:
            c->last = "|";
            return expectHas(coderChannelHasAsyncError, c->async);
        case 2:
            EXPECT_EQ(record(c->handle, coderChannelGetLastSyncError), c->sync);
            c->sync = "|";
            return;
        default:
            EXPECT_EQ(record(c->handle, coderChannelGetLastAsyncError), c->async);
            c->async = "|";
        }
    }

    /// What a plug-in does between two calls.
    void happening()
    {
        std::function<void()> what;
        try {
            pick(2) == 1 ? expectUpdate(what) : expectEvent(what);
            what();
        } catch (const Failure&) {
            EXPECT_ANY_THROW(what());
        }
        compareLog();
    }

    void read()
    {
        StreamModel& s = mostlyInput();
        Store buffers(pick(4));
        const double wanted = rarely() ? anyOf<double>({0, 1.5, NAN}) : double(buffers.size());
        const auto model = [&] {
            require(s.isInput, notSupported(true));
            expectStream(s, "read");
            for (auto& buffer : buffers) {
                core.delivery.push_back(rarely() ? nullptr : new PropertyMap);
                if (core.delivery.back() != nullptr) {
                    make(*static_cast<PropertyMap*>(core.delivery.back()), buffer.emplace());
                }
            }
            const bool matches = double(buffers.size()) == wanted;
            expectRelease(matches ? std::exchange(s.store, buffers) : buffers);
            require(matches, unexpected + "The number of buffers read did not match the expected "
                                          "number.");
        };
        call(s.handle, model,
             [&](void* handle) { return coderInputStreamReadBuffers(handle, 1, wanted); });
    }

    /// The stored buffer of an index, or null.
    static std::optional<Fields>* stored(StreamModel& s, int index)
    {
        const auto position = static_cast<std::size_t>(index) - 1;
        return position < s.store.size() && s.store[position] ? &s.store[position] : nullptr;
    }

    void field()
    {
        StreamModel& s = mostlyInput();
        const int index = anyIndex();
        const int fieldIndex = anyIndex();
        const std::string name = anyName();
        Buffer to(sizeof(int));
        std::string bytes;
        const auto model = [&] {
            require(s.isInput, notSupported(true));
            const std::string number = std::to_string(fieldIndex);
            const auto* const buffer = stored(s, index);
            require(buffer != nullptr,
                    unexpected + "Data buffer index: " + std::to_string(index) + " not found.");
            const Fields& fields = **buffer;
            require(!name.empty() || !fields.empty(),
                    unexpected + "No data found in the data buffer.");
            auto found = name.empty() ? fields.begin() : fields.find(name);
            found = found == fields.end() ? fields.find(name + number) : found;
            require(found != fields.end(),
                    unexpected + "Data buffer field: " + name + " not found for index: " + number);
            bytes = bytesOf(&found->second, 1);
        };
        call(s.handle, model, [&](void* handle) {
            return coderInputStreamReadBufferData(handle, index, fieldIndex, name.c_str(), "int32",
                                                  1, to.data());
        });
        EXPECT_EQ(to.written(), bytes);
    }

    void free()
    {
        StreamModel& s = mostlyInput();
        const int index = anyIndex();
        const auto model = [&] {
            if (auto* const buffer = stored(s, index); s.isInput && buffer != nullptr) {
                expectRelease(*std::exchange(*buffer, std::nullopt));
            }
        };
        call(s.handle, model, [&](void* handle) {
            coderInputStreamFreeBuffer(handle, index);
            return handle != nullptr && handle == s.handle;
        });
    }

    char id[CODER_ERROR_SIZE] = "", message[CODER_ERROR_SIZE] = "";
    std::mt19937_64 random;
    Calls table{"a", "b", "f", "o"};
    ChannelModel channels[3];
    ChannelModel* c = nullptr; ///< the one that is called
    Log expected;              ///< how what the core is to see begins
    bool elsewhere = false;    ///< whether something happens on another thread
    uint64_t calls = 0;
};

} // namespace

TEST(RandomTest, EveryCallDoesWhatTheModelSays)
{
    soak(3, [](uint64_t seed) { return Sequence(seed).run(); });
}
