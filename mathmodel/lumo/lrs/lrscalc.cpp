// The low-resolution orbit model record: its life cycle, the set-up from an
// ephemeris segment, and the one check of a model that every evaluation
// runs.
#include <algorithm>
#include <cmath>
#include <cstdlib>
#include <cstring>
#include <memory>

#include "errors.h"
#include "lrs_internal.h"
#include "lumo_ephemeris.h"
#include "runtime.h"

namespace lumo::lrs {
namespace {

using DoublePtr = std::unique_ptr<double, nova::FreeDeleter>;
struct SegmentDeleter {
    void operator()(EphemerisSeg_t* psSeg) const noexcept { LumoSatEphemerisFree(psSeg); }
};
using SegmentPtr = std::unique_ptr<EphemerisSeg_t, SegmentDeleter>;

constexpr double kStateMargin = 150.0;  // seconds of table before and after the pass
constexpr int kGridStep = 20;

DoublePtr CopyDoubles(const double* padfSource, std::size_t nCount) {
    if (padfSource == nullptr || nCount == 0) return nullptr;
    DoublePtr pCopy(static_cast<double*>(HMalloc(nCount * sizeof(double))));
    std::copy(padfSource, padfSource + nCount, pCopy.get());
    return pCopy;
}

// The scanner of the AVHRR: 2048 samples over +-55.4 degrees, six lines a
// second; reversed when the scan-line times run backwards.
LRSSensorModel_t ScannerConstants(bool bBackward, int nLines) {
    LRSSensorModel_t s{};
    s.dfRefLine = bBackward ? (nLines - 1) + 0.5 : 0.5;
    s.dfRefPixel = bBackward ? 2047.5 : 0.5;
    s.dfScanAngle0 = 0.9661719;
    s.dfScanAngleStep = bBackward ? 0.00094399 : -0.00094399;
    s.dfTimeOffset = 0.0;
    s.dfLineInterval = bBackward ? -1.0 / 6.0 : 1.0 / 6.0;
    s.dfSampleTimeOffset = 0.005308;
    s.dfSampleInterval = bBackward ? -2.828e-05 : 2.828e-05;
    for (int k = 0; k < 9; ++k) s.adfAlignment[k] = (k % 4 == 0) ? 1.0 : 0.0;
    s.nNumPixels = 2048;
    return s;
}

[[noreturn]] void BadModelField(const char* pszField, double dfValue, const char* pszWhy) {
    Fatal(Err::kBadArgument,
          MkName(_("Orbit model: field %s is %.17g, %s.\n"), pszField, dfValue, pszWhy));
}

void RequireFinite(const char* pszField, double dfValue) {
    if (!std::isfinite(dfValue)) BadModelField(pszField, dfValue, "not a finite number");
}

void CheckSensor(const LRSSensorModel_t& s) {
    RequireFinite("sSensor.dfRefLine", s.dfRefLine);
    RequireFinite("sSensor.dfRefPixel", s.dfRefPixel);
    RequireFinite("sSensor.dfScanAngle0", s.dfScanAngle0);
    RequireFinite("sSensor.dfTimeOffset", s.dfTimeOffset);
    RequireFinite("sSensor.dfSampleTimeOffset", s.dfSampleTimeOffset);
    RequireFinite("sSensor.dfSampleInterval", s.dfSampleInterval);
    if (!(std::isfinite(s.dfScanAngleStep) && s.dfScanAngleStep != 0.0)) {
        BadModelField("sSensor.dfScanAngleStep", s.dfScanAngleStep, "not a non-zero number");
    }
    if (!(std::isfinite(s.dfLineInterval) && s.dfLineInterval != 0.0)) {
        BadModelField("sSensor.dfLineInterval", s.dfLineInterval, "not a non-zero number");
    }
    if (s.nNumPixels < 1) BadModelField("sSensor.nNumPixels", s.nNumPixels, "not positive");
}

void CheckStateFrame(const LRSOrbitModel_t& m) {
    RequireFinite("dfFirstStateTime", m.dfFirstStateTime);
    if (!(std::isfinite(m.dfLastStateTime) && m.dfLastStateTime > m.dfFirstStateTime)) {
        BadModelField("dfLastStateTime", m.dfLastStateTime, "not after dfFirstStateTime");
    }
    if (m.padfStates == nullptr) return;
    if (m.nNumStates < 2) BadModelField("nNumStates", m.nNumStates, "fewer than 2 table entries");
    if (!(std::isfinite(m.dfStateInterval) && m.dfStateInterval > 0.0)) {
        BadModelField("dfStateInterval", m.dfStateInterval, "not a positive number");
    }
}

void CheckGrids(const LRSOrbitModel_t& m) {
    const bool bAny = std::any_of(m.apadfAngleGrids, m.apadfAngleGrids + LRS_NUM_ANGLE_GRIDS,
                                  [](const double* p) { return p != nullptr; });
    if (!bAny) return;
    if (m.nGridCols < 2 || m.nGridRows < 2) {
        BadModelField("nGridCols", m.nGridCols, "too small for the angle grids held");
    }
    if (m.nGridColStep != kGridStep || m.nGridRowStep != kGridStep) {
        BadModelField("nGridColStep", m.nGridColStep, "not the grid spacing 20");
    }
    if (m.nGridCols != (m.sSensor.nNumPixels - 2) / kGridStep + 2 ||
        m.nGridRows != (m.nNumScanLines - 2) / kGridStep + 2) {
        BadModelField("nGridRows", m.nGridRows, "inconsistent with the image size");
    }
}

}  // namespace
}  // namespace lumo::lrs

using namespace lumo::lrs;  // NOLINT(google-build-using-namespace)
using lumo::Err;
using lumo::Fatal;

LRSOrbitModel_t::LRSOrbitModel_t() : psEphemeris(nullptr), padfStates(nullptr) {
    Init();
}

LRSOrbitModel_t::LRSOrbitModel_t(const LRSOrbitModel_t& oOther)
    : psEphemeris(nullptr), padfStates(nullptr) {
    Init();
    CopyFrom(oOther);
}

LRSOrbitModel_t& LRSOrbitModel_t::operator=(const LRSOrbitModel_t& oOther) {
    if (this != &oOther) CopyFrom(oOther);
    return *this;
}

LRSOrbitModel_t::~LRSOrbitModel_t() {
    ReleaseTables();
    LumoSatEphemerisFree(psEphemeris);
}

void LRSOrbitModel_t::Init() {
    asControlPoints.clear();
    osTag = "E";
    psEphemeris = nullptr;
    sSensor = LRSSensorModel_t{};
    nEpochYear = 0;
    dfEpochSecOfYear = dfTimeOrigin = dfTimeEnd = dfGreenwichAngle = 0.0;
    std::fill(adfMeanElements, adfMeanElements + LRS_NUM_ELEMENTS, 0.0);
    nNumStates = 0;
    dfFirstStateTime = dfLastStateTime = dfStateInterval = 0.0;
    padfStates = nullptr;
    std::fill(adfOrbitCorr, adfOrbitCorr + 3, 0.0);
    std::fill(adfRollPoly, adfRollPoly + 2, 0.0);
    std::fill(adfPitchPoly, adfPitchPoly + 2, 0.0);
    std::fill(adfYawPoly, adfYawPoly + 2, 0.0);
    std::fill(apadfAngleGrids, apadfAngleGrids + LRS_NUM_ANGLE_GRIDS, nullptr);
    nGridCols = nGridRows = nGridColStep = nGridRowStep = 0;
    nGridColRemainder = nGridRowRemainder = 0;
    nNumScanLines = 0;
    sProjInfo = ProjInfo_t{};
    Geosys2ProjInfo(&sProjInfo, "LONG/LAT D000", 0.0, 0.0, 1.0, 1.0);
}

void LRSOrbitModel_t::ReleaseTables() {
    std::free(padfStates);
    padfStates = nullptr;
    for (double*& padfGrid : apadfAngleGrids) {
        std::free(padfGrid);
        padfGrid = nullptr;
    }
}

LRSOrbitModel_t* LRSOrbitModel_t::Clone() const {
    try {
        return new LRSOrbitModel_t(*this);
    } catch (const std::bad_alloc&) {
        return nullptr;
    } catch (const nova::OutOfMemoryException&) {
        return nullptr;
    }
}

void LRSOrbitModel_t::CopyFrom(const LRSOrbitModel_t& oOther) {
    if (&oOther == this) return;
    // Every new block is made before anything is replaced, so a failed
    // allocation leaves this model as it was.
    SegmentPtr pSegment(EphemerisSegDuplicate(oOther.psEphemeris));
    const std::size_t nStateCount =
        oOther.nNumStates > 0 ? static_cast<std::size_t>(oOther.nNumStates) * LRS_STATE_SIZE : 0;
    DoublePtr pStates = CopyDoubles(oOther.padfStates, nStateCount);
    const std::size_t nGridCount = oOther.nGridCols > 0 && oOther.nGridRows > 0
                                       ? static_cast<std::size_t>(oOther.nGridCols) *
                                             static_cast<std::size_t>(oOther.nGridRows)
                                       : 0;
    DoublePtr apGrids[LRS_NUM_ANGLE_GRIDS];
    for (int k = 0; k < LRS_NUM_ANGLE_GRIDS; ++k) {
        apGrids[k] = CopyDoubles(oOther.apadfAngleGrids[k], nGridCount);
    }
    std::vector<ControlPoint_t> asPoints = oOther.asControlPoints;
    std::string osNewTag = oOther.osTag;

    asControlPoints.swap(asPoints);
    osTag.swap(osNewTag);
    sProjInfo = oOther.sProjInfo;
    LumoSatEphemerisFree(psEphemeris);
    psEphemeris = pSegment.release();
    sSensor = oOther.sSensor;
    nEpochYear = oOther.nEpochYear;
    dfEpochSecOfYear = oOther.dfEpochSecOfYear;
    dfTimeOrigin = oOther.dfTimeOrigin;
    dfTimeEnd = oOther.dfTimeEnd;
    dfGreenwichAngle = oOther.dfGreenwichAngle;
    std::copy(oOther.adfMeanElements, oOther.adfMeanElements + LRS_NUM_ELEMENTS, adfMeanElements);
    nNumStates = oOther.nNumStates;
    dfFirstStateTime = oOther.dfFirstStateTime;
    dfLastStateTime = oOther.dfLastStateTime;
    dfStateInterval = oOther.dfStateInterval;
    ReleaseTables();
    padfStates = pStates.release();
    std::copy(oOther.adfOrbitCorr, oOther.adfOrbitCorr + 3, adfOrbitCorr);
    std::copy(oOther.adfRollPoly, oOther.adfRollPoly + 2, adfRollPoly);
    std::copy(oOther.adfPitchPoly, oOther.adfPitchPoly + 2, adfPitchPoly);
    std::copy(oOther.adfYawPoly, oOther.adfYawPoly + 2, adfYawPoly);
    nGridCols = oOther.nGridCols;
    nGridRows = oOther.nGridRows;
    nGridColStep = oOther.nGridColStep;
    nGridRowStep = oOther.nGridRowStep;
    nGridColRemainder = oOther.nGridColRemainder;
    nGridRowRemainder = oOther.nGridRowRemainder;
    for (int k = 0; k < LRS_NUM_ANGLE_GRIDS; ++k) apadfAngleGrids[k] = apGrids[k].release();
    nNumScanLines = oOther.nNumScanLines;
}

void LRSInitOrbitModel(EphemerisSeg_t* psSeg, LRSOrbitModel_t* psModel) {
    if (psSeg == nullptr || psModel == nullptr) {
        Fatal(Err::kBadArgument, _("LRSInitOrbitModel: null segment or model.\n"));
    }
    // Everything is read and checked before the model changes.
    const OrbitSetup sSetup = ReadOrbitSetup(*psSeg);
    SegmentPtr pSegment(EphemerisSegDuplicate(psSeg));

    LRSDeleteOrbitModel(psModel);
    LumoSatEphemerisFree(psModel->psEphemeris);
    psModel->psEphemeris = pSegment.release();
    const double dfFirst = std::min(sSetup.dfStart, sSetup.dfEnd);
    const double dfLast = std::max(sSetup.dfStart, sSetup.dfEnd);
    psModel->sSensor = ScannerConstants(sSetup.dfStart > sSetup.dfEnd, sSetup.nLines);
    psModel->nNumScanLines = sSetup.nLines;
    psModel->nEpochYear = sSetup.nYear;
    psModel->dfEpochSecOfYear = sSetup.dfEpochSec;
    psModel->dfGreenwichAngle = sSetup.dfGreenwich;
    std::copy(sSetup.adfElements, sSetup.adfElements + LRS_NUM_ELEMENTS, psModel->adfMeanElements);
    psModel->dfTimeOrigin = dfFirst;
    psModel->dfTimeEnd = dfLast + (dfLast - dfFirst) / (sSetup.nLines - 1);
    psModel->nNumStates =
        static_cast<int>(psModel->dfTimeEnd - psModel->dfTimeOrigin + 2.0 * kStateMargin + 1.0);
    psModel->dfFirstStateTime = -kStateMargin;
    psModel->dfLastStateTime = (psModel->nNumStates - 1) - kStateMargin;
    psModel->dfStateInterval = 1.0;
    std::fill(psModel->adfOrbitCorr, psModel->adfOrbitCorr + 3, 0.0);
    std::fill(psModel->adfRollPoly, psModel->adfRollPoly + 2, 0.0);
    std::fill(psModel->adfPitchPoly, psModel->adfPitchPoly + 2, 0.0);
    std::fill(psModel->adfYawPoly, psModel->adfYawPoly + 2, 0.0);
}

void LRSDeleteOrbitModel(LRSOrbitModel_t* psModel) {
    if (psModel == nullptr) return;
    std::free(psModel->padfStates);
    psModel->padfStates = nullptr;
    for (double*& padfGrid : psModel->apadfAngleGrids) {
        std::free(padfGrid);
        padfGrid = nullptr;
    }
    psModel->nGridCols = psModel->nGridRows = 0;
    psModel->nGridColStep = psModel->nGridRowStep = 0;
    psModel->nGridColRemainder = psModel->nGridRowRemainder = 0;
}

void LRSDelete(LRSOrbitModel_t* psModel, EphemerisSeg_t* psSeg) {
    LRSDeleteOrbitModel(psModel);
    LumoSatEphemerisFree(psSeg);
}

void LRSCheckOrbitModel(const LRSOrbitModel_t* psModel) {
    if (psModel == nullptr) Fatal(Err::kBadArgument, _("Orbit model: null model.\n"));
    const LRSOrbitModel_t& m = *psModel;
    static const char* const apszNames[LRS_NUM_ELEMENTS] = {
        "adfMeanElements[0]", "adfMeanElements[1]", "adfMeanElements[2]",
        "adfMeanElements[3]", "adfMeanElements[4]", "adfMeanElements[5]"};
    CheckMeanElements(m.adfMeanElements, apszNames);
    CheckSensor(m.sSensor);
    RequireFinite("dfEpochSecOfYear", m.dfEpochSecOfYear);
    RequireFinite("dfTimeOrigin", m.dfTimeOrigin);
    RequireFinite("dfTimeEnd", m.dfTimeEnd);
    RequireFinite("dfGreenwichAngle", m.dfGreenwichAngle);
    static const char* const apszRefinement[9] = {
        "adfOrbitCorr[0]", "adfOrbitCorr[1]", "adfOrbitCorr[2]", "adfRollPoly[0]", "adfRollPoly[1]",
        "adfPitchPoly[0]", "adfPitchPoly[1]", "adfYawPoly[0]",   "adfYawPoly[1]"};
    const double adfRefinement[9] = {m.adfOrbitCorr[0], m.adfOrbitCorr[1], m.adfOrbitCorr[2],
                                     m.adfRollPoly[0],  m.adfRollPoly[1],  m.adfPitchPoly[0],
                                     m.adfPitchPoly[1], m.adfYawPoly[0],   m.adfYawPoly[1]};
    for (int k = 0; k < 9; ++k) RequireFinite(apszRefinement[k], adfRefinement[k]);
    CheckStateFrame(m);
    CheckGrids(m);
}
