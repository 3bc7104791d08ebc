// Inputs for tests: random ones, the same on every run and every platform, and all of a kind.
#ifndef KORU_TESTS_CHOICES_H
#define KORU_TESTS_CHOICES_H

#include <cstddef>
#include <random>
#include <string>
#include <vector>

namespace test {

class Dice {
public:
    explicit Dice(unsigned seed) : engine_(seed) {}

    std::size_t below(std::size_t limit) { return engine_() % limit; }
    bool oneIn(std::size_t chances) { return below(chances) == 0; }

    template <class Sequence>
    typename Sequence::value_type const& from(Sequence const& choices) {
        return choices[below(choices.size())];
    }

    template <class String>
    String text(String const& alphabet, std::size_t longest) {
        String result;
        for (std::size_t left = below(longest + 1); left > 0; --left) result += from(alphabet);
        return result;
    }

private:
    std::mt19937 engine_;
};

/// Calls `visit` with every text of up to `longest` characters of the alphabet.
template <class Visit>
void forEachText(std::string const& alphabet, std::size_t longest, Visit visit) {
    std::vector<std::string> texts{""};
    for (std::size_t i = 0; i < texts.size(); ++i) {
        visit(texts[i]);
        if (texts[i].size() == longest) continue;
        for (char const c : alphabet) texts.push_back(texts[i] + c);
    }
}

} // namespace test

#endif
