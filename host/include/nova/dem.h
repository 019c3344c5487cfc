// Elevation models of the host (nova::dem): raster height surfaces queried by
// position, the global model on the EGM96 geoid, and a factory that opens
// elevation sources by kind.
//
// Every elevation model reports its coordinate reference system through
// GetCRS(): a horizontal system with heights, either compound with EGM96
// heights above mean sea level (vertical datum CS_VD_Orthometric) or 3-D
// with heights above the ellipsoid (CS_VD_Ellipsoidal). Positions passed to a
// model are in the horizontal units of that system (degrees for geographic
// ones, longitude first); heights come back in its vertical unit. Callers
// that work in another system convert through nova::ogc::utils.
//
// Models are immutable once made, and every query may run on several threads
// at once. Models are disposed of with their own Release(); DEMPtr does that.
#pragma once

#include <cstddef>
#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "nova/crs.h"

namespace nova {
namespace dem {

// Axis-aligned rectangle in the units of a model's horizontal system.
struct DEMExtent {
    double dfMinX = 0.0;
    double dfMinY = 0.0;
    double dfMaxX = 0.0;
    double dfMaxY = 0.0;

    bool Contains(double dfX, double dfY) const {
        return dfX >= dfMinX && dfX <= dfMaxX && dfY >= dfMinY && dfY <= dfMaxY;
    }
};

// Height written by the many-point query for a point without a height.
constexpr double kNoHeight = -1e20;

class IRasterDEM {
  public:
    // The system of positions and heights, still owned by the model.
    virtual const ogc::cs::ICRS* GetCRS() const = 0;
    // Where the model has heights (voids inside it may still have none).
    virtual DEMExtent GetCoverage() const = 0;
    // Height at one position. False, with dfHeight untouched, outside the
    // coverage, in a void, or for a non-finite position. Throws
    // nova::DataException naming the source when its data cannot be read.
    virtual bool GetHeight(double dfX, double dfY, double& dfHeight) const = 0;
    // Heights of nCount positions; a point without a height gets kNoHeight.
    // Returns how many points got a height. Throws as GetHeight.
    virtual int GetHeights(int nCount, const double* padfX, const double* padfY,
                           double* padfHeight) const = 0;
    // A short text for messages: the file name, or "EGM96 geoid".
    virtual std::string GetDescription() const = 0;
    // Disposes of this object.
    virtual void Release() = 0;

  protected:
    IRasterDEM() = default;
    virtual ~IRasterDEM() = default;
};

using DEMPtr = std::unique_ptr<IRasterDEM, ogc::Releaser>;

// ---------------------------------------------------------------------------
// Gridded models. A regular grid of height nodes, read in square tiles by a
// reader function, kept in a least-recently-used cache of bounded size and
// sampled bilinearly. File-based kinds build on it.
// ---------------------------------------------------------------------------

// Node (col, row) stands at (dfOriginX + col * dfStepX, dfOriginY + row *
// dfStepY). Positions within the coverage but beyond the outer nodes (the
// outer half cell of a raster whose values stand for whole cells) take the
// nearest edge node's height.
struct GridLayout {
    int nCols = 0;
    int nRows = 0;
    double dfOriginX = 0.0;
    double dfOriginY = 0.0;
    double dfStepX = 1.0;
    double dfStepY = -1.0;
    // Global longitude grids: column nCols is column 0 again, 360 degrees on.
    bool bWrapsLongitude = false;
    DEMExtent sCoverage;
};

// Fills the heights of nCols x nRows nodes starting at node (nCol0, nRow0),
// row by row, NaN for a void. Called from any thread, possibly for several
// tiles at once; throws nova::DataException when the data cannot be read.
using TileReader =
    std::function<void(int nCol0, int nRow0, int nCols, int nRows, float* pafHeights)>;

// A new gridded model. Between four nodes heights are interpolated
// bilinearly; voids among them are left out and the weights of the others
// renormalised, so a position has no height only when all four are voids.
// nCacheBytes bounds the memory of the tiles held (at least a few tiles are
// always kept). Throws nova::ParameterException for a null system, an empty
// or degenerate layout, or a missing reader.
IRasterDEM* CreateGridDEM(ogc::CRSPtr poCRS, const GridLayout& sLayout, TileReader fnReader,
                          std::size_t nCacheBytes, std::string osDescription);

// ---------------------------------------------------------------------------
// The factory
// ---------------------------------------------------------------------------

// Opens an elevation source of one kind: a new model; null when the source is
// not of this kind (so the next kind may try); throws nova::DataException
// naming the source when it is of this kind but unusable.
using DEMOpener = std::function<IRasterDEM*(const std::string& osSource, int nCacheMegabytes)>;

class DEMFactory {
  public:
    // The global model: the EGM96 geoid surface, i.e. mean sea level,
    // everywhere on Earth. With bEllipsoidalHeights false its heights are 0
    // above mean sea level in WGS 84 + EGM96 height (EPSG:4326+5773); with
    // true they are the geoid undulation, the height of mean sea level above
    // the WGS 84 ellipsoid, in WGS 84 3-D (EPSG:4979). The undulations come
    // from PROJ's EGM96 grid (proj-data), interpolated bilinearly exactly as
    // PROJ does; nCacheMegabytes (at least 1) bounds the memory of the grid
    // tiles held. A new model, or null when the geoid grid is not installed
    // (the orthometric model needs it too: its heights convert to
    // ellipsoidal ones only through it).
    static IRasterDEM* CreateGlobalDEM(bool bEllipsoidalHeights, int nCacheMegabytes);

    // Makes a further kind known to CreateDEM. Registering a kind name again
    // replaces its opener. Safe to call from any thread.
    static void RegisterKind(const std::string& osKind, DEMOpener fnOpener);
    // Names of the registered kinds, in registration order ("geoid" first,
    // always present).
    static std::vector<std::string> GetKinds();

    // Opens an elevation source. "geoid" (or "egm96") gives the global model
    // with heights above mean sea level; "KIND:SOURCE" asks the named kind
    // only; any other text is offered to every registered kind in
    // registration order. Throws nova::ParameterException naming the source
    // when no kind reads it (and the kinds tried), and passes on the
    // exception of a kind that recognised but could not use it.
    static IRasterDEM* CreateDEM(const std::string& osSource, int nCacheMegabytes);
};

// A model that answers outside the coverage (or in the voids) of poInner with
// the global geoid model in poInner's vertical datum: 0 for heights above
// mean sea level, the undulation for heights above the ellipsoid. The first
// time that happens it reports one warning naming the source (the host's
// warning road); positions that cannot be converted to longitude and latitude
// still get no height. Takes poInner; throws nova::DataException when the
// geoid grid is not installed.
IRasterDEM* WithGeoidFallback(DEMPtr poInner);

}  // namespace dem
}  // namespace nova
