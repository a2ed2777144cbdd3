// Settings of the library that a test changes.
#ifndef IMG_TEST_GUARD_H
#define IMG_TEST_GUARD_H

#include <utility>

// Gives a variable a value for a scope.
template <typename Value>
class setting {
public:
    template <typename Given>
    setting(Value &variable, Given &&value)
        : m_variable(variable), m_saved(std::exchange(variable, std::forward<Given>(value)))
    {
    }
    ~setting() { m_variable = std::move(m_saved); }
    setting(const setting &) = delete;
    setting &operator=(const setting &) = delete;

private:
    Value &m_variable;
    Value m_saved;
};

#endif
