// The stored record seen as ModelTerms, and back: the parameter table, the
// fixed and derived values, and the selectors that the model class and the
// sensor code choose.
#include <cmath>

#include "segment_access.h"
#include "srit/srit_internal.h"

namespace lumo {
namespace srit {

void ModelTerms::UpdateDerived() {
    dfCosAlongTilt = std::cos(std::atan(P[kAlongTilt]));
    dfTiltRatio = P[kAcrossTilt] / dfCosAlongTilt;
    dfDisplacement = (P[kAcrossTilt] * P[kAcrossTilt] + 1.0) / (P[kAcrossScale] * dfCosAlongTilt) +
                     2.0 * (dfTiltRatio * dfTiltRatio + 1.0) / dfTwoN;
}

ModelTerms TermsOfRecord(const SRITInfo_t& sModel) {
    const double* c = sModel.adfCoef;
    ModelTerms m;
    for (int p = 0; p < kMaxUnknowns; ++p) m.P[p] = c[kCoefOfParam[p]];
    m.dfTwoN = c[kCoefTwoN];
    m.dfIfov = c[kCoefIfov];
    m.dfCentreColumn = c[kCoefCentreColumn];
    m.dfCentreLine = c[kCoefCentreLine];
    m.dfCosAlongTilt = c[kCoefCosAlongTilt];
    m.dfDisplacement = c[kCoefDisplacement];
    m.dfTiltRatio = c[kCoefTiltRatio];
    m.dfLineCube = c[kCoefLineCube];
    m.dfAcrossCube = c[kCoefAcrossCube];
    m.dfElevationLine = c[kCoefElevationLine];

    const int M = sModel.nModelClass;
    const int S = sModel.nSensor;
    const bool bLineTableSensor = S == kSensorPla || S == kSensorMla;
    Selectors& f = m.sSelect;
    f.bLinear = bLineTableSensor || S == kSensorTm || S == kSensorEtm;
    f.bCubicClass = M == kClassCubic;
    f.bRadarLike = M == kClassRadarLike;
    f.bCurvature = M != kClassNoCurvature;
    // A stored P12 below this size is taken as not adjusted.
    f.bElevationTerm = std::abs(c[kCoefElevationAcross]) >= 1e-7;
    f.bLens = S == kSensorFormosatPan;
    f.bCurvedIncidence = sModel.anAux[SRIT_AUX_FORM] == SRIT_FORM_CURVED_INCIDENCE;
    if (bLineTableSensor) m.psLineTable = AttitudeLinesOf(sModel.psEphemeris);
    m.dfLineRounding = 0.5;
    if (sModel.psEphemeris != nullptr) m.nLines = sModel.psEphemeris->nNumLines;
    return m;
}

void StoreTerms(const ModelTerms& m, double* c) {
    for (int p = 0; p < kMaxUnknowns; ++p) c[kCoefOfParam[p]] = m.P[p];
    c[kCoefTwoN] = m.dfTwoN;
    c[kCoefIfov] = m.dfIfov;
    c[kCoefCentreColumn] = m.dfCentreColumn;
    c[kCoefCentreLine] = m.dfCentreLine;
    c[kCoefCosAlongTilt] = m.dfCosAlongTilt;
    c[kCoefDisplacement] = m.dfDisplacement;
    c[kCoefTiltRatio] = m.dfTiltRatio;
    c[kCoefLineCube] = m.dfLineCube;
    c[kCoefAcrossCube] = m.dfAcrossCube;
    c[kCoefElevationLine] = m.dfElevationLine;
}

bool IsLevelSensor(int nSensor) {
    return nSensor == kSensorPla || nSensor == kSensorMla || nSensor == kSensorSpot5Pan25 ||
           nSensor == kSensorSpot5Pan5 || nSensor == kSensorSpot5Multi;
}

}  // namespace srit
}  // namespace lumo
