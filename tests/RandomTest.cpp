// Random sequences of calls over several channels. Each call is compared with a model of what
// coder.h promises: its result and answers, what it asks of the core, the error records, the
// handles, and which property objects are alive. Null pointers and the conversion of values are
// left to the tables of the other tests.
//
// BRENIX_SEED is the seed of the first sequence; the next has the next one, so that a sequence that
// failed can be run first. BRENIX_SOAK_SECONDS is how long to go on.

#include "scripted/ChannelFixture.hpp"

#include <chrono>
#include <iostream>
#include <numeric>
#include <optional>
#include <random>

using namespace scripted;

namespace
{

/// What a property of the core holds; no type stands for a null object.
struct Value {
    std::string type;
    int count = 0;
    std::string bytes;
};
using Fields = std::map<std::string, Value>;
using Store = std::vector<std::optional<Fields>>;

struct StreamModel {
    bool isInput;
    void* handle = nullptr;
    bool supported = false;
};

struct ChannelModel {
    Core core; ///< stands in the global one while the channel is called
    void* handle = nullptr;
    StreamModel input{true};
    StreamModel output{false};
    std::string last = "|", sync = "|", async = "|"; ///< "identifier|message"
    Fields properties;
    Store store;
};

/// Leaves the model of a call, which must fail and leave this last error.
struct Failure {
    std::string error;
};

void require(bool condition, const std::string& message)
{
    condition ? void() : throw Failure{unexpected + message};
}

void requireStream(bool condition, bool isInput)
{
    const std::string error = ":notSupported|";
    condition ? void()
              : throw Failure{(isInput ? "brenix:InputStream" : "brenix:OutputStream") + error};
}

unsigned long saturated(double value)
{
    return value <= 0 ? 0 : value < 0x1p64 ? static_cast<unsigned long>(value) : ULONG_MAX;
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
            &S::init,     &S::commands, &S::commands, &S::queries, &S::queries, &S::queries,
            &S::property, &S::property, &S::errors,   &S::errors,  &S::handles, &S::happening,
            &S::filters,  &S::peek,     &S::read,     &S::read,    &S::field,   &S::field,
            &S::field,    &S::free,     &S::write,    &S::write,   &S::destroy};
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
    std::string anyName() { return anyOf({"a", "a", "a1", "b", "b-1", ""}); }
    std::string anyType() { return anyOf({"int32", "int32", "int32", "char", "uint32", "int24"}); }
    int anyCount() { return anyOf({0, 1, 1, 2, 3, 8, -1, INT_MIN}); }
    int anyIndex() { return anyOf({1, 1, 2, 3, 0, -1, INT_MIN, INT_MAX}); }
    double anyNumber()
    {
        return anyOf<double>({-INFINITY, -1, 0, 0.5, 1, 2.9, 3, 1e19, 0x1p64, INFINITY, NAN});
    }

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

    IPropertyInfo* make(const std::string& name, Value& value)
    {
        if (rarely()) {
            return nullptr;
        }
        if (rarely()) {
            value = {"char", 3, "hi\0"s};
            return new Counted<TScalarProperty<std::string>>(name, "hi");
        }
        auto* const vector = new Counted<TVectorProperty<int>>(name, pick(4));
        std::iota(vector->values.begin(), vector->values.end(), static_cast<int>(pick(100)));
        value = {"int32", static_cast<int>(vector->values.size()), {}};
        value.bytes = bytesOf(vector->values.data(), vector->values.size());
        return vector;
    }

    void* makeBuffer(std::optional<Fields>& fields)
    {
        if (rarely()) {
            return nullptr;
        }
        auto* const buffer = new PropertyMap;
        fields.emplace();
        for (const char* name : {"a1", "b", "b-1"}) {
            if (pick(2) == 1) {
                (*buffer)[name] = make(name, (*fields)[name]);
            }
        }
        return buffer;
    }

    void expectRelease(const Fields& fields)
    {
        for (const auto& [name, value] : fields) {
            if (!value.type.empty()) {
                expected.push_back("destroy(" + name + ")");
            }
        }
    }

    void expectRelease(const Store& buffers)
    {
        for (const auto& buffer : buffers) {
            expectRelease(buffer.value_or(Fields()));
        }
    }

    // What the core is to see, and what then may happen in it: a failure, or what plug-ins do.

    void expectCore(const std::string& operation, const std::string& arguments = "",
                    const std::string& side = "")
    {
        expected.push_back(side + operation + "(" + arguments + ")");
        if (!rarely()) {
            return;
        }
        std::function<void()>& hook = core.on[operation];
        switch (pick(c->handle == nullptr ? 2 : 5)) {
        case 0:
            hook = [] { throw brenixcore::CannotAddFilterWhileOpen("text"); };
            throw Failure{"brenix:Stream:cannotAddFilterWhileOpen|"};
        case 1:
            hook = [] { throw std::runtime_error("text"); };
            return require(false, "text");
        case 2:
            return expectUpdate(hook);
        default:
            return expectEvent(hook);
        }
    }

    void expectStream(const StreamModel& stream, const std::string& operation,
                      const std::string& arguments = "")
    {
        requireStream(stream.supported, stream.isInput);
        expectCore(operation, arguments, stream.isInput ? "input." : "output.");
    }

    void expectUpdate(std::function<void()>& update)
    {
        const std::string name = anyName();
        Value value;
        IPropertyInfo* const property = make(name, value);
        const auto stored = c->properties.find(name);
        const bool known = stored != c->properties.end();
        update = somewhere([=] {
            core.handler->onPropertyUpdate(property);
            brenixplugin::OwnedProperty stays(known ? nullptr : property);
        });
        if (property != nullptr) {
            expectRelease(Fields{{name, known ? std::exchange(stored->second, value) : value}});
        }
    }

    void expectEvent(std::function<void()>& event)
    {
        const std::string name = anyOf({"error", "error", "errorMessage", "warning",
                                        "warningMessage", "trace", "traceMessage", "Error", ""});
        const std::string id(anyOf({0U, 1U, 2000U}), 'i');
        event = somewhere([=] { raiseEvent(name, id, "m"); });
        if (name == "error") {
            expected.emplace_back("getMessage()");
        }
        if (!name.empty() && name != "Error") {
            expected.emplace_back("accept()");
        }
        if (name.starts_with("error")) {
            const auto* const fixed = "Array-based errors are not yet supported in Zelkor";
            (elsewhere ? c->async : c->sync) =
                id.substr(0, 1023) + "|" + (name == "error" ? "m" : fixed);
            elsewhere ? void() : throw Failure{"|"};
        }
    }

    std::function<void()> somewhere(const std::function<void()>& what)
    {
        elsewhere = pick(2) == 1;
        return elsewhere ? [=] { std::thread(what).join(); } : what;
    }

    // Calls and comparisons.

    /// Makes a call with a handle, or now and then with none, and compares its result.
    template <typename Function, typename... Arguments>
    void call(void* handle, const std::function<void()>& model, Function function,
              Arguments... arguments)
    {
        handle = rarely() ? nullptr : handle;
        int result = handle == nullptr ? 0 : 1;
        before = c->last;
        try {
            if (handle != nullptr) {
                c->last = "|";
                model();
            }
        } catch (const Failure& failure) {
            c->last = failure.error;
            result = 0;
        }
        EXPECT_EQ(function(handle, arguments...), result);
        compareLog();
    }

    /// The same for a function that leaves the last error alone.
    void keepLast() { c->last = before; }

    template <typename Answer>
    void ask(void* handle, int (*function)(void*, Answer*) noexcept,
             const std::function<Answer()>& model)
    {
        Buffer answer(sizeof(Answer));
        std::string bytes;
        const auto answered = [&] {
            const Answer value = model();
            bytes = bytesOf(&value, 1);
        };
        call(handle, answered, function, reinterpret_cast<Answer*>(answer.data()));
        EXPECT_EQ(answer.written(), bytes);
    }

    void compareLog()
    {
        EXPECT_EQ(std::exchange(core.log, {}), std::exchange(expected, {}));
        core.on.clear();
        ++calls;
    }

    void compareChannels()
    {
        int objects = 0;
        for (const ChannelModel& channel : channels) {
            Store all = channel.store;
            all.emplace_back(channel.properties);
            for (const auto& fields : all) {
                for (const auto& field : fields.value_or(Fields())) {
                    objects += field.second.type.empty() ? 0 : 1;
                }
            }
            if (channel.handle != nullptr) {
                EXPECT_EQ(record(channel.handle, coderChannelGetLastError), channel.last);
            }
        }
        EXPECT_EQ(liveProperties, objects);
    }

    static std::string record(void* handle, int (*query)(void*, char*, char*) noexcept)
    {
        Buffer id(CODER_ERROR_SIZE);
        Buffer message(CODER_ERROR_SIZE);
        EXPECT_EQ(query(handle, id, message), 1);
        return id.text() + "|" + message.text();
    }

    // Values of the caller.

    struct Typed {
        std::string type;
        int count;
    };

    Typed typed() { return {anyType(), anyCount()}; }

    static void requireValid(const Typed& value, const std::string& name, const std::string& use)
    {
        require(value.type != "int24", "Unsupported type: int24 for " + use + ".");
        require(value.count > 0 || value.type == "char",
                "Unsupported length for data " + name + ". Length must be 1 or greater.");
    }

    /// Draws an option list with one option or none.
    void drawOptions()
    {
        optionCount = pick(2);
        option = typed();
    }

    /// The list as the core is to see it.
    const char* requireOptions()
    {
        optionCount == 1 ? requireValid(option, "o", "option o") : void();
        return optionCount == 1 ? "[o]" : "";
    }

    /// The bytes that a value is read as.
    static std::string expectCopy(const Value& value, const std::string& name, const Typed& asked,
                                  const std::string& what)
    {
        require(asked.type != "int24", what + name + " is not a supported type: int24");
        require(value.type == asked.type,
                "Property: " + name + " is not of the expected type: " +
                    (asked.type == "char" ? "string or ustring scalar or vector." : asked.type));
        require(value.count <= std::max(asked.count, 0),
                "Property value: " + name + " is too large for allocated space.");
        return value.bytes;
    }

    // The functions.

    void create()
    {
        *c = ChannelModel();
        core = {};
        const double in = anyNumber();
        const double out = anyNumber();
        Buffer id(CODER_ERROR_SIZE);
        Buffer message(CODER_ERROR_SIZE);
        std::string error = "|";
        try {
            expectCore("Converter", "c");
            expectCore("Channel", "d, " + std::to_string(saturated(in)) + ", " +
                                      std::to_string(saturated(out)));
        } catch (const Failure& failure) {
            error = failure.error;
            expected.resize(expected.size() == 2 ? 3 : 1, "~Converter()");
        }
        c->handle = coderChannelCreate("d", "c", id, message, in, out);
        EXPECT_EQ(c->handle == nullptr ? id.text() + "|" + message.text() : "|", error);
        compareLog();
    }

    void destroy()
    {
        expectRelease(c->properties);
        expectRelease(c->store);
        expected.insert(expected.end(), {"~Channel()", "~Converter()"});
        coderChannelDestroy(c->handle);
        compareLog();
        *c = ChannelModel();
    }

    void init()
    {
        const bool hasStreams = core.hasStreams = !rarely();
        bool newInput = false;
        bool newOutput = false;
        const auto model = [&] {
            expectCore("init", requireOptions());
            c->input.supported = c->output.supported = false;
            expectCore("getInputStream");
            expectRelease(std::exchange(c->store, {}));
            c->input.supported = hasStreams;
            newInput = true;
            expectCore("getOutputStream");
            c->output.supported = hasStreams;
            newOutput = true;
        };
        drawOptions();
        call(c->handle, model, coderChannelInit, optionCount, "o", option.type.c_str(),
             option.count, zeros);
        compareChannels();
        void* const input = coderChannelGetInputStream(c->handle);
        void* const output = coderChannelGetOutputStream(c->handle);
        EXPECT_EQ(std::exchange(c->input.handle, input) != input, newInput);
        EXPECT_EQ(std::exchange(c->output.handle, output) != output, newOutput);
        c->last = "|";
        if (core.properties != nullptr && newOutput && c->properties.empty()) {
            (*core.properties)["a"] = make("a", c->properties["a"]);
        }
    }

    void commands()
    {
        drawOptions();
        const char* const type = option.type.c_str();
        switch (pick(4)) {
        case 0:
            return call(
                c->handle, [&] { expectCore("close"); }, coderChannelClose);
        case 1:
            return call(
                c->handle, [&] { expectCore("term"); }, coderChannelTerm);
        case 2:
            return call(
                c->handle, [&] { expectCore("open", requireOptions()); }, coderChannelOpen,
                optionCount, "o", type, option.count, zeros);
        default:
            return call(
                c->handle, [&] { expectCore("execute", "go, "s + requireOptions()); },
                coderChannelExecute, "go", optionCount, "o", type, option.count, zeros);
        }
    }

    StreamModel& anyStream() { return pick(2) == 1 ? c->input : c->output; }
    const StreamModel& mostly(bool input) { return input != rarely() ? c->input : c->output; }

    void queries()
    {
        const StreamModel& s = anyStream();
        const auto flag = [&](const char* operation) {
            return [&, operation] { return expectStream(s, operation), core.flag; };
        };
        const auto number = [&](const char* operation) {
            return [&, operation] { return expectStream(s, operation), double(core.number); };
        };
        const auto space = [&] {
            expectStream(s, "isUnlimited");
            return core.unlimited ? INFINITY : number("getSpaceAvailable")();
        };
        const auto isOpen = [&] { return expectCore("isOpen"), core.flag; };
        switch (pick(7)) {
        case 0:
            return ask<uint8_t>(c->handle, coderChannelIsOpen, isOpen);
        case 1:
            return ask<uint8_t>(s.handle, coderStreamIsSupported, [&] { return s.supported; });
        case 2:
            return ask<uint8_t>(s.handle, coderStreamIsDeviceDone, flag("isDeviceDone"));
        case 3:
            return ask<uint8_t>(s.handle, coderStreamIsOpen, flag("isOpen"));
        case 4:
            return ask<double>(s.handle, coderStreamGetCountDimension, number("getCountDimension"));
        case 5:
            return ask<double>(s.handle, coderStreamGetDataAvailable, number("getDataAvailable"));
        default:
            return ask<double>(s.handle, coderStreamGetSpaceAvailable, space);
        }
    }

    void handles()
    {
        const StreamModel& s = anyStream();
        const auto get = s.isInput ? coderChannelGetInputStream : coderChannelGetOutputStream;
        const auto compare = [&](void* from) {
            EXPECT_EQ(get(from), from == nullptr ? nullptr : s.handle);
            return from == nullptr ? 0 : 1;
        };
        call(
            c->handle, [] {}, compare);
        EXPECT_EQ(coderStreamGetChannel(s.handle), s.handle == nullptr ? nullptr : c->handle);
    }

    void property()
    {
        const std::string name = anyName();
        const Typed asked = typed();
        Buffer to(16);
        std::string bytes;
        const auto model = [&] {
            const auto found = c->properties.find(name);
            require(found != c->properties.end(), "Custom property: " + name + " not found.");
            bytes = expectCopy(found->second, name, asked, "Custom property: ");
        };
        call(c->handle, model, coderChannelGetPropertyValue, name.c_str(), asked.type.c_str(),
             asked.count, to.data());
        EXPECT_EQ(to.written(), bytes);
    }

    void errors()
    {
        const auto hasSync = [&] { return keepLast(), c->sync.front() != '|'; };
        const auto hasAsync = [&] { return c->async.front() != '|'; };
        switch (pick(4)) {
        case 0:
            return ask<uint8_t>(c->handle, coderChannelHasSyncError, hasSync);
        case 1:
            return ask<uint8_t>(c->handle, coderChannelHasAsyncError, hasAsync);
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

    void filters()
    {
        const StreamModel& s = anyStream();
        drawOptions();
        const char* const type = option.type.c_str();
        const auto tune = [&] {
            requireStream(s.supported, s.isInput);
            expectStream(s, "tuneFilters", requireOptions());
        };
        const auto add = [&] {
            requireStream(s.supported, s.isInput);
            expectStream(s, "addFilter", "f, "s + requireOptions());
        };
        call(
            s.handle, [&] { expectStream(s, "flush"); }, coderStreamFlush);
        call(s.handle, tune, coderStreamTuneFilters, optionCount, "o", type, option.count, zeros);
        call(s.handle, add, coderStreamAddFilter, "f", optionCount, "o", type, option.count, zeros);
    }

    void peek()
    {
        const StreamModel& s = mostly(true);
        core.counts.assign(pick(5), anyOf({0UL, 3UL, ULONG_MAX}));
        const double most = anyNumber();
        double size = anyNumber();
        double reported = size;
        double total = -1;
        double sum = 0;
        Buffer counts(4 * sizeof(double));
        std::string bytes;
        const auto model = [&] {
            requireStream(s.isInput, true);
            expectStream(s, "peekCounts", std::to_string(saturated(most)));
            const auto room = std::isnan(size) ? 0 : saturated(size);
            const std::vector<double> all(core.counts.begin(), core.counts.end());
            const std::size_t n = std::min(all.size(), room);
            bytes = bytesOf(all.data(), n);
            sum = double(std::accumulate(core.counts.begin(), core.counts.begin() + long(n), 0UL));
            reported = double(n);
        };
        call(s.handle, model, coderInputStreamPeek, &total,
             reinterpret_cast<double*>(counts.data()), &size, most);
        EXPECT_EQ(bytesOf(&size, 1), bytesOf(&reported, 1));
        EXPECT_EQ(counts.written(), bytes);
        EXPECT_EQ(total, sum);
    }

    void read()
    {
        const StreamModel& s = mostly(true);
        const double counts = anyNumber();
        Store buffers(pick(4));
        const auto wanted = rarely() ? anyNumber() : double(buffers.size());
        const auto model = [&] {
            requireStream(s.isInput, true);
            expectStream(s, "read", std::to_string(saturated(counts)));
            for (auto& buffer : buffers) {
                core.delivery.push_back(makeBuffer(buffer));
            }
            const bool matches = double(buffers.size()) == wanted;
            expectRelease(matches ? std::exchange(c->store, buffers) : buffers);
            require(matches, "The number of buffers read did not match the expected number.");
        };
        call(s.handle, model, coderInputStreamReadBuffers, counts, wanted);
    }

    /// The stored buffer of an index, or null.
    Fields* stored(int32_t index)
    {
        const auto position = static_cast<std::size_t>(index) - 1;
        return position < c->store.size() && c->store[position] ? &*c->store[position] : nullptr;
    }

    void field()
    {
        const StreamModel& s = mostly(true);
        const int index = anyIndex();
        const int fieldIndex = anyIndex();
        const std::string name = anyName();
        const Typed asked = typed();
        Buffer to(16);
        std::string bytes;
        const auto model = [&] {
            requireStream(s.isInput, true);
            const std::string number = std::to_string(fieldIndex);
            Fields* const fields = stored(index);
            require(fields, "Data buffer index: " + std::to_string(index) + " not found.");
            require(!name.empty() || !fields->empty(), "No data found in the data buffer.");
            auto found = name.empty() ? fields->begin() : fields->find(name);
            found = found == fields->end() ? fields->find(name + number) : found;
            require(found != fields->end(),
                    "Data buffer field: " + name + " not found for index: " + number);
            bytes = expectCopy(found->second, name, asked, "Data buffer field: ");
        };
        call(s.handle, model, coderInputStreamReadBufferData, index, fieldIndex, name.c_str(),
             asked.type.c_str(), asked.count, to.data());
        EXPECT_EQ(to.written(), bytes);
    }

    void free()
    {
        const StreamModel& s = mostly(true);
        const int index = anyIndex();
        if (s.handle != nullptr) {
            c->last = "|";
            if (s.isInput && stored(index) != nullptr) {
                auto& position = c->store[static_cast<std::size_t>(index) - 1];
                expectRelease(*std::exchange(position, std::nullopt));
            }
        }
        coderInputStreamFreeBuffer(s.handle, index);
        compareLog();
    }

    void write()
    {
        const StreamModel& s = mostly(false);
        Typed buffers[] = {typed(), typed()};
        buffers[1].type = buffers[0].type;
        const std::size_t n = pick(3);
        double answer = -1;
        double written = 0;
        const auto model = [&] {
            requireStream(!s.isInput && s.supported, false);
            for (std::size_t i = 0; i < n; ++i) {
                requireValid(buffers[i], "data", "data being written");
            }
            expectStream(s, "write", std::to_string(n));
            written = double(core.number);
        };
        call(s.handle, model, coderOutputStreamWriteTypedDataOld, &answer, n,
             buffers[0].type.c_str(), buffers[0].count, zeros, buffers[1].count, zeros);
        EXPECT_EQ(answer, written);
    }

    static constexpr char zeros[32] = {}; ///< elements of every type
    std::mt19937_64 random;
    ChannelModel channels[3];
    ChannelModel* c = nullptr; ///< the one that is called
    Log expected;              ///< what the core is to see
    std::string before;        ///< the last error before the call
    bool elsewhere = false;    ///< whether something happens on another thread
    uint64_t optionCount = 0;
    Typed option;
    uint64_t calls = 0;
};

uint64_t environment(const char* name, uint64_t otherwise)
{
    const char* const text = std::getenv(name);
    return text == nullptr ? otherwise : std::stoull(text);
}

} // namespace

TEST(RandomTest, EveryCallDoesWhatTheModelSays)
{
    using Clock = std::chrono::steady_clock;
    const auto end = Clock::now() + std::chrono::seconds(environment("BRENIX_SOAK_SECONDS", 3));
    const uint64_t seed = environment("BRENIX_SEED", std::random_device()());
    std::cout << "BRENIX_SEED=" << seed << std::endl;
    uint64_t sequences = 0;
    uint64_t calls = 0;
    do {
        SCOPED_TRACE("BRENIX_SEED=" + std::to_string(seed + sequences));
        calls += Sequence(seed + sequences).run();
        ++sequences;
    } while (!HasFailure() && Clock::now() < end);
    std::cout << sequences << " sequences, " << calls << " calls" << std::endl;
}
