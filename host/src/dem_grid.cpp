// Gridded elevation models: height nodes read in square tiles, held in a
// bounded least-recently-used cache and sampled bilinearly.

#include <algorithm>
#include <cmath>
#include <cstdint>
#include <list>
#include <memory>
#include <mutex>
#include <string>
#include <unordered_map>
#include <utility>
#include <vector>

#include "dem.h"
#include "runtime.h"

namespace nova {
namespace dem {
namespace {

constexpr const char* kSourceFile = "host/src/dem_grid.cpp";
// Nodes per tile side: 256 x 256 floats, 256 KiB a tile.
constexpr int kTileSize = 256;
// Tiles always kept whatever the budget, so that the four nodes around a
// position never evict each other.
constexpr std::size_t kMinTiles = 4;

using Tile = std::vector<float>;
using TilePtr = std::shared_ptr<const Tile>;

[[noreturn]] void ThrowParameter(const char* pszName, const std::string& osMessage, int nLine) {
    throw ParameterException(pszName, 1, "", "", osMessage, kSourceFile, "nova::dem::CreateGridDEM",
                             nLine);
}

// Tiles by number, the least recently used dropped first. Tiles are shared,
// so a reader keeps using a tile that another thread has evicted meanwhile.
class TileCache {
  public:
    TileCache(std::size_t nMaxTiles, TileReader fnReader, const GridLayout& sLayout)
        : mnMaxTiles(nMaxTiles), mfnReader(std::move(fnReader)), msLayout(sLayout) {}

    TilePtr Get(int nTileCol, int nTileRow) const {
        const std::int64_t nKey = static_cast<std::int64_t>(nTileRow) * kKeyStride + nTileCol;
        {
            std::lock_guard<std::mutex> oLock(moMutex);
            auto it = moTiles.find(nKey);
            if (it != moTiles.end()) {
                moOrder.splice(moOrder.begin(), moOrder, it->second.itOrder);
                return it->second.poTile;
            }
        }
        // Read outside the lock: other tiles stay available meanwhile. Two
        // threads may read the same tile; the second one keeps the first's.
        TilePtr poTile = Read(nTileCol, nTileRow);
        std::lock_guard<std::mutex> oLock(moMutex);
        auto it = moTiles.find(nKey);
        if (it != moTiles.end()) return it->second.poTile;
        moOrder.push_front(nKey);
        moTiles.emplace(nKey, Entry{poTile, moOrder.begin()});
        while (moTiles.size() > mnMaxTiles) {
            moTiles.erase(moOrder.back());
            moOrder.pop_back();
        }
        return poTile;
    }

  private:
    // Above any tile column count: an int column over kTileSize stays below.
    static constexpr std::int64_t kKeyStride = std::int64_t{1} << 32;

    struct Entry {
        TilePtr poTile;
        std::list<std::int64_t>::iterator itOrder;
    };

    TilePtr Read(int nTileCol, int nTileRow) const {
        const int nCol0 = nTileCol * kTileSize;
        const int nRow0 = nTileRow * kTileSize;
        const int nCols = std::min(kTileSize, msLayout.nCols - nCol0);
        const int nRows = std::min(kTileSize, msLayout.nRows - nRow0);
        auto poTile =
            std::make_shared<Tile>(static_cast<std::size_t>(kTileSize) * kTileSize, std::nanf(""));
        std::vector<float> afRead(static_cast<std::size_t>(nCols) * nRows);
        mfnReader(nCol0, nRow0, nCols, nRows, afRead.data());
        for (int r = 0; r < nRows; ++r) {
            std::copy_n(afRead.begin() + static_cast<std::ptrdiff_t>(r) * nCols, nCols,
                        poTile->begin() + static_cast<std::ptrdiff_t>(r) * kTileSize);
        }
        return poTile;
    }

    std::size_t mnMaxTiles;
    TileReader mfnReader;
    GridLayout msLayout;
    mutable std::mutex moMutex;
    mutable std::list<std::int64_t> moOrder;
    mutable std::unordered_map<std::int64_t, Entry> moTiles;
};

// Node lookups of one query; remembers the last tile so that neighbouring
// nodes cost no cache lookup. Belongs to the call.
class NodeReader {
  public:
    explicit NodeReader(const TileCache& oCache) : moCache(oCache) {}

    const float& Value(int nCol, int nRow) {
        const int nTileCol = nCol / kTileSize;
        const int nTileRow = nRow / kTileSize;
        if (!mpoTile || nTileCol != mnTileCol || nTileRow != mnTileRow) {
            mpoTile = moCache.Get(nTileCol, nTileRow);
            mnTileCol = nTileCol;
            mnTileRow = nTileRow;
        }
        return (*mpoTile)[static_cast<std::size_t>(nRow % kTileSize) * kTileSize +
                          static_cast<std::size_t>(nCol % kTileSize)];
    }

    // The four nodes around a position: top-left, top-right, bottom-left,
    // bottom-right. Mostly within one tile, read with a single lookup.
    void Quad(int nCol0, int nRow0, int nCol1, int nRow1, float* pafOut) {
        const int nTileCol = nCol0 / kTileSize;
        const int nTileRow = nRow0 / kTileSize;
        if (nCol1 / kTileSize != nTileCol || nRow1 / kTileSize != nTileRow) {
            pafOut[0] = Value(nCol0, nRow0);
            pafOut[1] = Value(nCol1, nRow0);
            pafOut[2] = Value(nCol0, nRow1);
            pafOut[3] = Value(nCol1, nRow1);
            return;
        }
        const float* pafTop = &Value(nCol0, nRow0);
        const std::ptrdiff_t nRight = nCol1 - nCol0;
        const std::ptrdiff_t nDown = static_cast<std::ptrdiff_t>(nRow1 - nRow0) * kTileSize;
        pafOut[0] = pafTop[0];
        pafOut[1] = pafTop[nRight];
        pafOut[2] = pafTop[nDown];
        pafOut[3] = pafTop[nDown + nRight];
    }

  private:
    const TileCache& moCache;
    TilePtr mpoTile;
    int mnTileCol = -1;
    int mnTileRow = -1;
};

class GridDEM final : public IRasterDEM {
  public:
    GridDEM(ogc::CRSPtr poCRS, const GridLayout& sLayout, TileReader fnReader,
            std::size_t nMaxTiles, std::string osDescription)
        : mpoCRS(std::move(poCRS)),
          msLayout(sLayout),
          moCache(nMaxTiles, std::move(fnReader), sLayout),
          mosDescription(std::move(osDescription)) {}

    const ogc::cs::ICRS* GetCRS() const override { return mpoCRS.get(); }
    DEMExtent GetCoverage() const override { return msLayout.sCoverage; }
    std::string GetDescription() const override { return mosDescription; }
    void Release() override { delete this; }

    bool GetHeight(double dfX, double dfY, double& dfHeight) const override {
        NodeReader oNodes(moCache);
        return Sample(oNodes, dfX, dfY, dfHeight);
    }

    int GetHeights(int nCount, const double* padfX, const double* padfY,
                   double* padfHeight) const override {
        NodeReader oNodes(moCache);
        int nFound = 0;
        for (int i = 0; i < nCount; ++i) {
            double dfHeight = kNoHeight;
            if (Sample(oNodes, padfX[i], padfY[i], dfHeight)) {
                ++nFound;
            } else {
                dfHeight = kNoHeight;
            }
            padfHeight[i] = dfHeight;
        }
        return nFound;
    }

  private:
    ~GridDEM() override = default;

    // Column position of a longitude on a wrapping grid, in [0, nCols).
    double WrappedColumn(double dfX) const {
        const double dfPeriod = msLayout.nCols * msLayout.dfStepX;
        double dfCol = std::fmod((dfX - msLayout.dfOriginX) / dfPeriod, 1.0) * msLayout.nCols;
        if (dfCol < 0.0) dfCol += msLayout.nCols;
        return dfCol >= msLayout.nCols ? 0.0 : dfCol;
    }

    bool Sample(NodeReader& oNodes, double dfX, double dfY, double& dfHeight) const {
        if (!std::isfinite(dfX) || !std::isfinite(dfY)) return false;
        if (!msLayout.bWrapsLongitude && !msLayout.sCoverage.Contains(dfX, dfY)) return false;
        if (msLayout.bWrapsLongitude &&
            (dfY < msLayout.sCoverage.dfMinY || dfY > msLayout.sCoverage.dfMaxY)) {
            return false;
        }
        const double dfRow = std::clamp((dfY - msLayout.dfOriginY) / msLayout.dfStepY, 0.0,
                                        static_cast<double>(msLayout.nRows - 1));
        const double dfCol = msLayout.bWrapsLongitude
                                 ? WrappedColumn(dfX)
                                 : std::clamp((dfX - msLayout.dfOriginX) / msLayout.dfStepX, 0.0,
                                              static_cast<double>(msLayout.nCols - 1));
        const int nCol0 = std::min(static_cast<int>(dfCol), msLayout.nCols - 1);
        const int nRow0 = std::min(static_cast<int>(dfRow), msLayout.nRows - 1);
        // On a wrapping grid the column after the last one is the first.
        const int nCol1 = msLayout.bWrapsLongitude ? (nCol0 + 1) % msLayout.nCols
                                                   : std::min(nCol0 + 1, msLayout.nCols - 1);
        const int nRow1 = std::min(nRow0 + 1, msLayout.nRows - 1);
        const double dfS = dfCol - nCol0;
        const double dfT = dfRow - nRow0;
        float afValue[4];
        oNodes.Quad(nCol0, nRow0, nCol1, nRow1, afValue);
        if (!std::isnan(afValue[0] + afValue[1] + afValue[2] + afValue[3])) {
            const double dfTop = afValue[0] + dfS * (afValue[1] - afValue[0]);
            const double dfBottom = afValue[2] + dfS * (afValue[3] - afValue[2]);
            dfHeight = dfTop + dfT * (dfBottom - dfTop);
            return true;
        }
        const double adfWeight[4] = {(1 - dfS) * (1 - dfT), dfS * (1 - dfT), (1 - dfS) * dfT,
                                     dfS * dfT};
        double dfSum = 0.0;
        double dfWeights = 0.0;
        for (int i = 0; i < 4; ++i) {
            if (std::isnan(afValue[i]) || adfWeight[i] <= 0.0) continue;
            dfSum += adfWeight[i] * afValue[i];
            dfWeights += adfWeight[i];
        }
        if (!(dfWeights > 0.0)) return false;
        dfHeight = dfSum / dfWeights;
        return true;
    }

    ogc::CRSPtr mpoCRS;
    GridLayout msLayout;
    TileCache moCache;
    std::string mosDescription;
};

void CheckLayout(const GridLayout& sLayout) {
    if (sLayout.nCols < 1 || sLayout.nRows < 1) {
        ThrowParameter(
            "sLayout",
            FormatString("Invalid elevation grid size %d x %d", sLayout.nCols, sLayout.nRows),
            __LINE__);
    }
    const double adfValues[] = {sLayout.dfOriginX, sLayout.dfOriginY, sLayout.dfStepX,
                                sLayout.dfStepY};
    const bool bFinite = std::all_of(std::begin(adfValues), std::end(adfValues),
                                     [](double dfValue) { return std::isfinite(dfValue); });
    if (!bFinite || sLayout.dfStepX == 0.0 || sLayout.dfStepY == 0.0) {
        ThrowParameter(
            "sLayout",
            FormatString("Invalid elevation grid origin (%g, %g) or step (%g, %g)",
                         sLayout.dfOriginX, sLayout.dfOriginY, sLayout.dfStepX, sLayout.dfStepY),
            __LINE__);
    }
    const DEMExtent& sBox = sLayout.sCoverage;
    if (!(sBox.dfMinX <= sBox.dfMaxX && sBox.dfMinY <= sBox.dfMaxY)) {
        ThrowParameter("sLayout",
                       FormatString("Invalid elevation coverage (%g, %g) - (%g, %g)", sBox.dfMinX,
                                    sBox.dfMinY, sBox.dfMaxX, sBox.dfMaxY),
                       __LINE__);
    }
}

}  // namespace

IRasterDEM* CreateGridDEM(ogc::CRSPtr poCRS, const GridLayout& sLayout, TileReader fnReader,
                          std::size_t nCacheBytes, std::string osDescription) {
    if (!poCRS) ThrowParameter("poCRS", "Elevation grid without a coordinate system", __LINE__);
    if (!fnReader) ThrowParameter("fnReader", "Elevation grid without a tile reader", __LINE__);
    CheckLayout(sLayout);
    const std::size_t nTileBytes = sizeof(float) * kTileSize * kTileSize;
    const std::size_t nMaxTiles = std::max(kMinTiles, nCacheBytes / nTileBytes);
    return new GridDEM(std::move(poCRS), sLayout, std::move(fnReader), nMaxTiles,
                       std::move(osDescription));
}

}  // namespace dem
}  // namespace nova
