// Finds the known word closest to a misspelt one.
#pragma once

#include <algorithm>
#include <cstddef>
#include <numeric>
#include <string_view>
#include <utility>
#include <vector>

namespace vesk {

/// The number of letters to insert, delete or replace to turn one into the other.
inline std::size_t lettersBetween(std::string_view a, std::string_view b) {
  std::vector<std::size_t> row(b.size() + 1);
  std::iota(row.begin(), row.end(), 0U);
  for (std::size_t i = 1; i <= a.size(); ++i) {
    std::size_t diagonal = std::exchange(row[0], i);
    for (std::size_t j = 1; j <= b.size(); ++j) {
      const std::size_t replaced = diagonal + (a[i - 1] == b[j - 1] ? 0 : 1);
      diagonal = std::exchange(row[j], std::min({row[j] + 1, row[j - 1] + 1, replaced}));
    }
  }
  return row.back();
}

/// The first of the nearest words; empty if all differ in more than a third of the letters of `word`, or two.
template <class Words>
std::string_view nearestOf(std::string_view word, const Words& words) {
  constexpr std::size_t kLongest = 80;  // no key is as long
  if (word.size() > kLongest) return {};
  std::size_t distance = std::max<std::size_t>(2, word.size() / 3) + 1;
  std::string_view nearest;
  for (std::string_view each : words) {
    const std::size_t letters = lettersBetween(word, each);
    if (letters < distance) nearest = each, distance = letters;
  }
  return nearest;
}

}  // namespace vesk
