// Edit distances between a word and those that would have been right.
#include "hfs/records/nearest_word.h"

#include <algorithm>

namespace VELK {

namespace {

// Edit distance in which swapping two neighbours counts as one step.
std::size_t EditDistance(const std::string& a, const std::string& b) {
    std::vector<std::vector<std::size_t>> steps(a.size() + 1,
                                                std::vector<std::size_t>(b.size() + 1));
    for (std::size_t i = 0; i <= a.size(); ++i) {
        for (std::size_t j = 0; j <= b.size(); ++j) {
            if (i == 0 || j == 0) {
                steps[i][j] = i + j;
                continue;
            }
            const std::size_t change = a[i - 1] == b[j - 1] ? 0 : 1;
            std::size_t best =
                std::min({steps[i - 1][j] + 1, steps[i][j - 1] + 1, steps[i - 1][j - 1] + change});
            if (i > 1 && j > 1 && a[i - 1] == b[j - 2] && a[i - 2] == b[j - 1]) {
                best = std::min(best, steps[i - 2][j - 2] + 1);
            }
            steps[i][j] = best;
        }
    }
    return steps[a.size()][b.size()];
}

}  // namespace

std::string NearestWord(const std::string& wrong, const std::vector<std::string>& words) {
    std::string nearest;
    std::size_t best = std::max<std::size_t>(1, std::min<std::size_t>(3, wrong.size() / 2)) + 1;
    for (const std::string& word : words) {
        if (wrong.size() >= 3 && word.starts_with(wrong)) {
            return word;
        }
    }
    for (const std::string& word : words) {
        if (wrong.size() > word.size() + 3) {
            continue;
        }
        const std::size_t distance = EditDistance(wrong, word);
        if (distance < best && distance < word.size()) {
            best = distance;
            nearest = word;
        }
    }
    return nearest;
}

std::string DidYouMean(const std::string& wrong, const std::vector<std::string>& words) {
    const std::string nearest = NearestWord(wrong, words);
    return nearest.empty() ? "" : " (did you mean " + nearest + "?)";
}

}  // namespace VELK
