#include "ortho_frame.h"

#include <algorithm>
#include <cmath>
#include <limits>
#include <utility>

#include "gdal_common.h"

namespace lumo {
namespace gdal {
namespace detail {
namespace {

using nova::mathmodel::IMathModel;

// Spacing, in grid points, of the lattice on which the smooth parts of the
// height lookup are computed exactly. Reprojections and geoid undulations
// bend far less than a millimetre over 16 output pixels.
constexpr int kLatticeStep = 16;
// Height iteration of the image-to-ground mapping.
constexpr int kPlainIterations = 10;
constexpr int kDampedIterations = 30;
constexpr double kHeightConvergence = 0.005;  // metres
constexpr double kHeightAcceptance = 0.5;     // metres, for damped iterations
// Undulation tiles: the whole EGM96 grid fits in 4 MB.
constexpr int kUndulationCacheMegabytes = 8;

nova::ogc::CRSPtr WithEllipsoidalHeights(const nova::ogc::cs::ICRS& oCrs) {
    return nova::ogc::CRSPtr(
        nova::ogc::utils::CreateCompoundCS(&oCrs, nova::ogc::cs::CS_VD_Ellipsoidal));
}

// The model with its ground positions in another CRS. Borrows the model.
class ReprojectedModel final : public nova::mathmodel::PointMathModel {
  public:
    using PointMathModel::GroundToImage;
    using PointMathModel::ImageToGround;

    ReprojectedModel(const IMathModel& oModel, const nova::ogc::cs::ICRS& oOutput)
        : moModel(oModel),
          mpoCRS(nova::ogc::utils::CreateCompoundCS(
              &oOutput, oModel.GetCRS()->GetVerticalDatumType() == nova::ogc::cs::CS_VD_Orthometric
                            ? nova::ogc::cs::CS_VD_Orthometric
                            : nova::ogc::cs::CS_VD_Ellipsoidal)),
          moToModel(oOutput, *oModel.GetCRS()),
          moFromModel(*oModel.GetCRS(), oOutput) {}

    const nova::ogc::cs::ICRS* GetCRS() const override { return mpoCRS.get(); }
    nova::mathmodel::MathModelType GetModelType() const override { return moModel.GetModelType(); }
    std::string GetModelName() const override { return moModel.GetModelName(); }
    int GetNumColumns() const override { return moModel.GetNumColumns(); }
    int GetNumRows() const override { return moModel.GetNumRows(); }
    int GetDownsampleFactor() const override { return moModel.GetDownsampleFactor(); }
    int GetMinValidHeight(double& dfHeight) const override {
        return moModel.GetMinValidHeight(dfHeight);
    }
    int GetMaxValidHeight(double& dfHeight) const override {
        return moModel.GetMaxValidHeight(dfHeight);
    }
    bool IsHeightDependent() const override { return moModel.IsHeightDependent(); }
    bool IsEqual(const IMathModel* poOther) const override { return poOther == this; }
    IMathModel* Clone() const override { return new ReprojectedModel(moModel, *mpoCRS); }
    void SetDownsampleFactor(int) override {}

    int ImageToGround(double dfPixel, double dfLine, double dfZ, double& dfX, double& dfY,
                      bool bFlag) const override {
        double dfMX = 0.0;
        double dfMY = 0.0;
        if (moModel.ImageToGround(dfPixel, dfLine, dfZ, dfMX, dfMY, bFlag) != 0) return -1;
        return moFromModel.Apply(dfMX, dfMY, dfX, dfY) ? 0 : -1;
    }
    int GroundToImage(double dfX, double dfY, double dfZ, double& dfPixel, double& dfLine,
                      bool bFlag) const override {
        double dfMX = 0.0;
        double dfMY = 0.0;
        if (!moToModel.Apply(dfX, dfY, dfMX, dfMY)) return -1;
        return moModel.GroundToImage(dfMX, dfMY, dfZ, dfPixel, dfLine, bFlag);
    }

  private:
    const IMathModel& moModel;
    nova::ogc::CRSPtr mpoCRS;
    HorizontalTransform moToModel;
    HorizontalTransform moFromModel;
};

// Values of a lattice node: where the elevation model is sampled and the
// datum shift there.
struct LatticeNode {
    double dfDemX = 0.0;
    double dfDemY = 0.0;
    double dfShift = 0.0;
    bool bOk = false;
};

// Lattice positions along one axis: every kLatticeStep-th point and the last.
std::vector<int> LatticePositions(int nSize) {
    std::vector<int> anPos;
    for (int i = 0; i < nSize - 1; i += kLatticeStep) anPos.push_back(i);
    anPos.push_back(nSize - 1);
    return anPos;
}

// The lattice interval holding point k: its two nodes and the weight of the
// second.
struct LatticeSpan {
    std::size_t n0;
    std::size_t n1;
    double dfWeight;
};

LatticeSpan SpanOf(const std::vector<int>& anPos, int k) {
    if (anPos.size() == 1) return {0, 0, 0.0};
    const std::size_t n0 = std::min<std::size_t>(k / kLatticeStep, anPos.size() - 2);
    return {n0, n0 + 1, static_cast<double>(k - anPos[n0]) / (anPos[n0 + 1] - anPos[n0])};
}

}  // namespace

HorizontalTransform::HorizontalTransform(const nova::ogc::cs::ICRS& oFrom,
                                         const nova::ogc::cs::ICRS& oTo) {
    nova::ogc::CRSPtr poFrom = WithEllipsoidalHeights(oFrom);
    nova::ogc::CRSPtr poTo = WithEllipsoidalHeights(oTo);
    if (poFrom->GetDefinition() == poTo->GetDefinition()) return;
    nova::ogc::ct::IMathTransform* poTransform =
        nova::ogc::utils::CreateCRSTransform(poFrom.get(), poTo.get(), 0.0);
    if (poTransform == nullptr) {
        LUMO_GDAL_FAIL("no transformation relates " + oFrom.GetName() + " to " + oTo.GetName());
    }
    mpoTransform.reset(poTransform, nova::ogc::Releaser());
}

bool HorizontalTransform::Apply(double dfX, double dfY, double& dfOutX, double& dfOutY) const {
    if (!mpoTransform) {
        dfOutX = dfX;
        dfOutY = dfY;
        return std::isfinite(dfX) && std::isfinite(dfY);
    }
    double dfZ = 0.0;
    return mpoTransform->TransformPoint(dfX, dfY, 0.0, dfOutX, dfOutY, dfZ);
}

OrthoFrame::OrthoFrame(const IMathModel& oModel, const nova::dem::IRasterDEM& oDem,
                       nova::ogc::CRSPtr poOutput)
    : moDem(oDem), mpoOutput(std::move(poOutput)) {
    const nova::ogc::cs::ICRS* poModelCRS = oModel.GetCRS();
    if (poModelCRS == nullptr) LUMO_GDAL_FAIL("the math model has no coordinate system");
    if (HorizontalTransform(*mpoOutput, *poModelCRS).IsIdentity()) {
        mpoModel = &oModel;
    } else {
        mpoReprojected = std::make_unique<ReprojectedModel>(oModel, *mpoOutput);
        mpoModel = mpoReprojected.get();
    }
    moToDem = HorizontalTransform(*mpoOutput, *oDem.GetCRS());

    using nova::ogc::cs::CS_VD_Ellipsoidal;
    using nova::ogc::cs::CS_VD_None;
    using nova::ogc::cs::CS_VD_Orthometric;
    const auto eModel = poModelCRS->GetVerticalDatumType();
    const auto eDem = oDem.GetCRS()->GetVerticalDatumType();
    if (eModel == CS_VD_None || (eModel == CS_VD_Orthometric) == (eDem == CS_VD_Orthometric)) {
        return;
    }
    // Heights above mean sea level are the undulation below ellipsoidal ones.
    mdfShiftSign = eDem == CS_VD_Orthometric ? 1.0 : -1.0;
    mpoUndulation.reset(nova::dem::DEMFactory::CreateGlobalDEM(true, kUndulationCacheMegabytes));
    if (!mpoUndulation) {
        LUMO_GDAL_FAIL("the EGM96 geoid grid (Debian package proj-data) is needed to convert " +
                       oDem.GetDescription() + "'s heights to the model's, and is not installed");
    }
    moToGeographic = HorizontalTransform(*mpoOutput, *mpoUndulation->GetCRS());
}

bool OrthoFrame::DemPosition(double dfX, double dfY, double& dfDemX, double& dfDemY,
                             double& dfShift) const {
    if (!moToDem.Apply(dfX, dfY, dfDemX, dfDemY)) return false;
    dfShift = 0.0;
    if (mdfShiftSign == 0.0) return true;
    double dfLon = 0.0;
    double dfLat = 0.0;
    double dfUndulation = 0.0;
    if (!moToGeographic.Apply(dfX, dfY, dfLon, dfLat) ||
        !mpoUndulation->GetHeight(dfLon, dfLat, dfUndulation)) {
        return false;
    }
    dfShift = mdfShiftSign * dfUndulation;
    return true;
}

bool OrthoFrame::InDemCoverage(double dfX, double dfY) const {
    double dfDemX = 0.0;
    double dfDemY = 0.0;
    return moToDem.Apply(dfX, dfY, dfDemX, dfDemY) && moDem.GetCoverage().Contains(dfDemX, dfDemY);
}

bool OrthoFrame::HeightAt(double dfX, double dfY, double& dfZ) const {
    double dfDemX = 0.0;
    double dfDemY = 0.0;
    double dfShift = 0.0;
    double dfHeight = 0.0;
    if (!DemPosition(dfX, dfY, dfDemX, dfDemY, dfShift) ||
        !moDem.GetHeight(dfDemX, dfDemY, dfHeight)) {
        return false;
    }
    dfZ = dfHeight + dfShift;
    return true;
}

void OrthoFrame::HeightsOfGrid(double dfX0, double dfY0, double dfStepX, double dfStepY, int nCols,
                               int nRows, float* pafZ) const {
    const bool bDirect = moToDem.IsIdentity() && mdfShiftSign == 0.0;
    const std::vector<int> anLatticeCols = LatticePositions(nCols);
    const std::vector<int> anLatticeRows = LatticePositions(nRows);
    const std::size_t nLatticeCols = anLatticeCols.size();
    std::vector<LatticeNode> asLattice;
    std::vector<LatticeSpan> asColSpans;
    if (!bDirect) {
        for (int nRow : anLatticeRows) {
            for (int nCol : anLatticeCols) {
                LatticeNode sNode;
                sNode.bOk = DemPosition(dfX0 + nCol * dfStepX, dfY0 + nRow * dfStepY, sNode.dfDemX,
                                        sNode.dfDemY, sNode.dfShift);
                asLattice.push_back(sNode);
            }
        }
        for (int nCol = 0; nCol < nCols; ++nCol) asColSpans.push_back(SpanOf(anLatticeCols, nCol));
    }
    std::vector<LatticeNode> asRowNodes(nLatticeCols);  // lattice blended to the current row
    std::vector<double> adfX(static_cast<std::size_t>(nCols));
    std::vector<double> adfY(adfX.size());
    std::vector<double> adfShift(adfX.size(), 0.0);
    std::vector<double> adfHeight(adfX.size());
    for (int nRow = 0; nRow < nRows; ++nRow) {
        const double dfY = dfY0 + nRow * dfStepY;
        if (bDirect) {
            for (int nCol = 0; nCol < nCols; ++nCol) {
                adfX[nCol] = dfX0 + nCol * dfStepX;
                adfY[nCol] = dfY;
            }
        } else {
            const LatticeSpan sRows = SpanOf(anLatticeRows, nRow);
            for (std::size_t i = 0; i < nLatticeCols; ++i) {
                const LatticeNode& sA = asLattice[sRows.n0 * nLatticeCols + i];
                const LatticeNode& sB = asLattice[sRows.n1 * nLatticeCols + i];
                const double dfT = sRows.dfWeight;
                asRowNodes[i] = {sA.dfDemX + dfT * (sB.dfDemX - sA.dfDemX),
                                 sA.dfDemY + dfT * (sB.dfDemY - sA.dfDemY),
                                 sA.dfShift + dfT * (sB.dfShift - sA.dfShift), sA.bOk && sB.bOk};
            }
            for (int nCol = 0; nCol < nCols; ++nCol) {
                const LatticeSpan& sCols = asColSpans[nCol];
                const LatticeNode& sA = asRowNodes[sCols.n0];
                const LatticeNode& sB = asRowNodes[sCols.n1];
                if (sA.bOk && sB.bOk) {
                    const double dfS = sCols.dfWeight;
                    adfX[nCol] = sA.dfDemX + dfS * (sB.dfDemX - sA.dfDemX);
                    adfY[nCol] = sA.dfDemY + dfS * (sB.dfDemY - sA.dfDemY);
                    adfShift[nCol] = sA.dfShift + dfS * (sB.dfShift - sA.dfShift);
                } else if (!DemPosition(dfX0 + nCol * dfStepX, dfY, adfX[nCol], adfY[nCol],
                                        adfShift[nCol])) {
                    // Near a failing node the point is computed exactly.
                    adfX[nCol] = std::numeric_limits<double>::quiet_NaN();
                }
            }
        }
        moDem.GetHeights(nCols, adfX.data(), adfY.data(), adfHeight.data());
        float* pafRow = pafZ + static_cast<std::size_t>(nRow) * nCols;
        for (int nCol = 0; nCol < nCols; ++nCol) {
            pafRow[nCol] = adfHeight[nCol] == nova::dem::kNoHeight
                               ? std::numeric_limits<float>::quiet_NaN()
                               : static_cast<float>(adfHeight[nCol] + adfShift[nCol]);
        }
    }
}

bool OrthoFrame::GroundToImage(double dfX, double dfY, double& dfPixel, double& dfLine) const {
    double dfZ = 0.0;
    return HeightAt(dfX, dfY, dfZ) &&
           mpoModel->GroundToImage(dfX, dfY, dfZ, dfPixel, dfLine, false) == 0 &&
           std::isfinite(dfPixel) && std::isfinite(dfLine);
}

bool OrthoFrame::ImageToGround(double dfPixel, double dfLine, double& dfX, double& dfY) const {
    double dfZ = 0.0;
    for (int i = 0; i < kPlainIterations + kDampedIterations; ++i) {
        double dfNewZ = 0.0;
        if (mpoModel->ImageToGround(dfPixel, dfLine, dfZ, dfX, dfY, false) != 0 ||
            !HeightAt(dfX, dfY, dfNewZ)) {
            return false;
        }
        const double dfChange = std::fabs(dfNewZ - dfZ);
        if (dfChange < kHeightConvergence) return std::isfinite(dfX) && std::isfinite(dfY);
        // Steep terrain seen obliquely can make the plain iteration
        // oscillate; halving the steps then settles it.
        dfZ = i < kPlainIterations ? dfNewZ : 0.5 * (dfZ + dfNewZ);
        if (i + 1 == kPlainIterations + kDampedIterations && dfChange < kHeightAcceptance) {
            return mpoModel->ImageToGround(dfPixel, dfLine, dfZ, dfX, dfY, false) == 0;
        }
    }
    return false;
}

}  // namespace detail
}  // namespace gdal
}  // namespace lumo
