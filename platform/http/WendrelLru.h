#pragma once

#include <QByteArray>
#include <QHash>

#include <list>
#include <utility>

// Values under byte-string keys within a budget of accounted bytes: each entry costs what its
// owner says the value holds on the heap, plus its key and entryOverhead. Inserting beyond the
// budget drops the least recently used entries first. Not locked.
template <typename Value>
class WendrelLru {
    struct Entry {
        QByteArray key;
        Value value;
        qsizetype cost;
    };

public:
    // The entry, the list's links, the hash's slot and the key's header, with the allocator's
    // share of each (measured with glibc's: a little more than they take).
    static constexpr qsizetype entryOverhead = qsizetype(sizeof(Entry)) + 128;

    explicit WendrelLru(qsizetype budget)
        : budget(budget) {}

    // The value, now the most recently used; null when there is none.
    Value* find(const QByteArray& key) {
        const auto found = index.constFind(key);
        if (found == index.cend())
            return nullptr;
        order.splice(order.begin(), order, *found);
        return &order.front().value;
    }

    // Adds or replaces the value as the most recently used; one costing more than the whole
    // budget is not kept.
    void insert(const QByteArray& key, Value value, qsizetype valueBytes) {
        remove(key);
        const qsizetype cost = entryOverhead + key.size() + valueBytes;
        if (cost > budget)
            return;
        while (used + cost > budget)
            removeOldest();
        order.push_front({key, std::move(value), cost});
        index.insert(key, order.begin());
        used += cost;
    }

    void remove(const QByteArray& key) {
        const auto found = index.find(key);
        if (found == index.end())
            return;
        used -= (*found)->cost;
        order.erase(*found);
        index.erase(found);
    }

    qsizetype bytes() const { return used; }
    qsizetype size() const { return index.size(); }

private:
    void removeOldest() {
        const Entry& oldest = order.back();
        used -= oldest.cost;
        index.remove(oldest.key);
        order.pop_back();
    }

    const qsizetype budget;
    qsizetype used = 0;
    std::list<Entry> order; // most recently used first
    QHash<QByteArray, typename std::list<Entry>::iterator> index;
};
