// Remembers what a function makes of a text, because many tokens hold the same texts.

#ifndef TOOLS_MEMO_H
#define TOOLS_MEMO_H

#include <functional>
#include <string>
#include <unordered_map>
#include <utility>

namespace tool {

template <typename Value>
class Memo {
public:
    explicit Memo(std::function<Value(const std::string&)> make) : m_make(std::move(make)) {}

    // Valid until the next call.
    const Value& of(const std::string& strText)
    {
        if (strText.size() > TEXT_MAX) {
            m_long = m_make(strText);
            return m_long;
        }
        const auto pKnown = m_known.find(strText);
        if (pKnown != m_known.end()) {
            return pKnown->second;
        }
        Value value = m_make(strText);
        if (m_known.size() >= TEXTS_MAX) {
            m_known.clear();
        }
        return m_known.emplace(strText, std::move(value)).first->second;
    }

private:
    static constexpr size_t TEXTS_MAX = 1000;
    static constexpr size_t TEXT_MAX = 1000; // bytes; long texts take much memory and seldom repeat

    const std::function<Value(const std::string&)> m_make;
    std::unordered_map<std::string, Value> m_known;
    Value m_long = {}; // for the last text that was too long to remember
};

} // namespace tool

#endif
