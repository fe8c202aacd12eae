#include "Nearest.h"

#include <algorithm>
#include <array>
#include <numeric>

namespace tool {

size_t distance(const std::string& strOne, const std::string& strOther)
{
    // line[j] is the distance from the first i characters of strOne to the first j of strOther. The lines
    // above are those of i - 1 and i - 2.
    typedef std::vector<size_t> Line;
    std::array<Line, 3> lines;
    lines.fill(Line(strOther.size() + 1));
    auto& [twoAbove, above, line] = lines;
    std::iota(line.begin(), line.end(), size_t{0});
    for (size_t i = 1; i <= strOne.size(); ++i) {
        std::rotate(lines.begin(), lines.begin() + 1, lines.end());
        line[0] = i;
        for (size_t j = 1; j <= strOther.size(); ++j) {
            const size_t nReplaced = above[j - 1] + (strOne[i - 1] != strOther[j - 1]);
            line[j] = std::min({nReplaced, above[j] + 1, line[j - 1] + 1});
            if (i > 1 && j > 1 && strOne[i - 1] == strOther[j - 2] && strOne[i - 2] == strOther[j - 1]) {
                line[j] = std::min(line[j], twoAbove[j - 2] + 1);
            }
        }
    }
    return line.back();
}

std::string didYouMean(const std::string& strWord, const std::vector<std::string>& strNames)
{
    std::string strNearest;
    size_t nNearest = SIZE_MAX;
    for (const std::string& strName : strNames) {
        const size_t nLongest = std::max(strName.size(), strWord.size());
        const size_t nDistance = distance(strWord, strName);
        if (nDistance < nNearest && nDistance <= nLongest / 3) {
            nNearest = nDistance;
            strNearest = strName;
        }
    }
    return strNearest.empty() ? "" : "did you mean \"" + strNearest + "\"?";
}

} // namespace tool
