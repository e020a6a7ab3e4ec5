#include "Order.hpp"

#include "JetStream.hpp"

#include <charconv>
#include <string_view>

namespace natsio
{

namespace
{

constexpr std::string_view rankNames[] = {":hello", "", ":end"};

std::optional<std::uint64_t> readNumber(std::string_view text)
{
    std::uint64_t number = 0;
    const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number);
    const bool isAll = error == std::errc() && end == text.data() + text.size();
    return isAll ? std::optional(number) : std::nullopt;
}

} // namespace

std::string Label::id() const
{
    return writer + ":" + std::to_string(turn.seq) +
           std::string(rankNames[static_cast<std::size_t>(turn.rank)]);
}

std::optional<Label> Label::read(const std::string& id, const std::string& stored)
{
    const std::size_t colon = id.find(':');
    const std::size_t end = std::min(id.find(':', colon + 1), id.size());
    if (colon == std::string::npos) {
        return std::nullopt;
    }
    const std::string_view text = id;
    const auto seq = readNumber(text.substr(colon + 1, end - colon - 1));
    const auto all = readNumber(stored);
    const auto* const rank =
        std::find(std::begin(rankNames), std::end(rankNames), text.substr(end));
    if (!seq || !all || rank == std::end(rankNames)) {
        return std::nullopt;
    }
    return Label{
        id.substr(0, colon), {*seq, static_cast<Rank>(rank - std::begin(rankNames))}, *all};
}

bool Order::take(const Label& label, Item& item, Moment now)
{
    const auto [entry, isNew] = writers.try_emplace(label.writer);
    Writer& writer = entry->second;
    beginners += isNew ? 1 : 0;
    writer.stored = std::max(writer.stored, label.stored);
    if (writer.begun && label.turn.rank == Rank::Data && label.turn.seq < writer.next) {
        return false;
    }
    if (writer.held.empty()) {
        writer.since = now;
    }
    if (!writer.held.try_emplace(label.turn, std::move(item)).second) {
        return false;
    }
    if (writer.begun) {
        release(writer, now);
    }
    return true;
}

std::optional<Order::Item> Order::next()
{
    if (ready.empty()) {
        return std::nullopt;
    }
    Item item = std::move(ready.front());
    ready.pop_front();
    return item;
}

void Order::settle(Moment now)
{
    for (auto& [name, writer] : writers) {
        if (!writer.begun &&
            (writer.stored >= writer.held.begin()->first.seq || now - writer.since >= patience)) {
            begin(writer, now);
        }
    }
    // Of several, as they are in the stream.
    std::stable_sort(ready.begin(), ready.end(),
                     [](const Item& one, const Item& other) { return one.sort < other.sort; });
}

void Order::giveUp(Moment now, std::size_t most)
{
    for (auto& [name, writer] : writers) {
        if (!writer.held.empty() &&
            (now - writer.since >= patience || (writer.begun && writer.held.size() >= most))) {
            begin(writer, now);
        }
    }
}

void Order::excuse(Moment now)
{
    for (auto& [name, writer] : writers) {
        writer.since = now;
    }
}

/// With the first of those that it has.
void Order::begin(Writer& writer, Moment now)
{
    if (!std::exchange(writer.begun, true)) {
        --beginners;
        writer.read = writer.stored;
    }
    writer.next = writer.held.begin()->first.seq;
    release(writer, now);
}

void Order::release(Writer& writer, Moment now)
{
    while (!writer.held.empty()) {
        const auto first = writer.held.begin();
        const auto [seq, rank] = first->first;
        if (seq > writer.next && seq > writer.read) {
            return;
        }
        first->second.follows = seq <= writer.next;
        writer.next = std::max(writer.next, rank == Rank::Data ? seq + 1 : seq);
        writer.since = now;
        writer.place = first->second.sort = std::max(writer.place, first->second.place);
        ready.push_back(std::move(first->second));
        writer.held.erase(first);
    }
}

} // namespace natsio
