// Ground positions of points measured in several images: the least-squares
// meeting of their rays, the elevations of tie points and of control points
// without one, and the per-point estimates and residuals a block reports.
#include <cmath>
#include <vector>

#include "srit/srit_internal.h"

namespace lumo {
namespace srit {
namespace {

// Number of images in which the point takes part in the adjustment.
int UsedSlots(const PointRecord& sPoint) {
    int n = 0;
    for (const PointSlot& sSlot : sPoint.asSlots) n += sSlot.nFlag == 1 ? 1 : 0;
    return n;
}

// Ground position of a point's measurements met from several images.
struct Intersection {
    double dfX = 0.0, dfY = 0.0, dfZ = 0.0;
    double dfMeanAbsX = 0.0, dfMeanAbsY = 0.0;  // mean |estimate - image-derived position|
};

// Intersects the rays of the point's used measurements near elevation Z0:
// every image gives its ground position at Z0 and the direction in which it
// moves with the elevation; the least-squares meeting point gives X, Y and the
// elevation change. When the directions are parallel (no intersection), the
// mean ground position at Z0 is taken.
Intersection Intersect(const Adjustment& sAdj, const PointRecord& sPoint, double dfZ0) {
    NormalEquations sNormal(3);
    std::vector<double> adfX, adfY;
    for (std::size_t k = 0; k < sAdj.asImages.size(); ++k) {
        const PointSlot& sSlot = sPoint.asSlots[k];
        if (sSlot.nFlag != 1) continue;
        const ImageState& sImg = sAdj.asImages[k];
        const GroundTerms s = ImageToGround(sImg.sTerms, sSlot.dfXc, sSlot.dfYc, dfZ0);
        const Displacement a = DisplacementOf(sImg.sTerms, sSlot.dfXc);
        adfX.push_back(s.dfX);
        adfY.push_back(s.dfY);
        double* pdfRow = sNormal.Row();
        pdfRow[0] = 1.0;
        pdfRow[1] = 0.0;
        pdfRow[2] = -a.ax;
        sNormal.AddRow(-s.dfX, 1.0);
        pdfRow[0] = 0.0;
        pdfRow[1] = 1.0;
        pdfRow[2] = -a.ay;
        sNormal.AddRow(-s.dfY, 1.0);
    }
    Intersection sOut;
    if (adfX.empty()) return sOut;
    double adfSolution[3] = {0.0, 0.0, 0.0};
    if (adfX.size() >= 2 && sNormal.Solve(adfSolution) && std::isfinite(adfSolution[2])) {
        sOut.dfX = adfSolution[0];
        sOut.dfY = adfSolution[1];
        sOut.dfZ = dfZ0 + adfSolution[2];
    } else {
        for (std::size_t i = 0; i < adfX.size(); ++i) {
            sOut.dfX += adfX[i] / static_cast<double>(adfX.size());
            sOut.dfY += adfY[i] / static_cast<double>(adfY.size());
        }
        sOut.dfZ = dfZ0;
    }
    for (std::size_t i = 0; i < adfX.size(); ++i) {
        sOut.dfMeanAbsX += std::abs(sOut.dfX - adfX[i]) / static_cast<double>(adfX.size());
        sOut.dfMeanAbsY += std::abs(sOut.dfY - adfY[i]) / static_cast<double>(adfY.size());
    }
    return sOut;
}

}  // namespace

bool IsTieOrNoElevation(const PointRecord& sPoint) {
    return sPoint.cType == 'H' || sPoint.cType == 'P';
}

// Elevations of the points without one: first the mean elevation of the
// points that have one, then (and after every iteration) the intersection of
// their measurements in two or more images.
void EstimateElevations(Adjustment& sAdj, bool bFirst) {
    if (bFirst) {
        double dfSum = 0.0;
        int nCount = 0;
        for (const PointRecord& sPoint : sAdj.asPoints) {
            if (sPoint.nInUse != 1 || (sPoint.cType != 'X' && sPoint.cType != 'A')) continue;
            dfSum += sPoint.dfZ;
            ++nCount;
        }
        const double dfMean = nCount > 0 ? dfSum / nCount : 0.0;
        for (PointRecord& sPoint : sAdj.asPoints) {
            if (sPoint.nInUse == 1 && IsTieOrNoElevation(sPoint)) sPoint.dfEstZ = dfMean;
        }
    }
    for (PointRecord& sPoint : sAdj.asPoints) {
        if (sPoint.nInUse != 1 || !IsTieOrNoElevation(sPoint) || UsedSlots(sPoint) < 2) continue;
        const Intersection sMeet = Intersect(sAdj, sPoint, sPoint.dfEstZ);
        sPoint.dfEstX = sMeet.dfX;
        sPoint.dfEstY = sMeet.dfY;
        sPoint.dfEstZ = sMeet.dfZ;
    }
}

// Ground estimate and residuals (given minus estimated) of every point from
// its used measurements.
void EstimatePoints(Adjustment& sAdj) {
    for (PointRecord& sPoint : sAdj.asPoints) {
        if (sPoint.nInUse != 1) continue;
        const int nUsed = UsedSlots(sPoint);
        if (nUsed == 0) continue;
        const bool bKnownZ = sPoint.cType == 'X' || sPoint.cType == 'A';
        const double dfZ0 = bKnownZ ? sPoint.dfZ : sPoint.dfEstZ;
        if (nUsed == 1) {
            // One ray: its ground position at the point's (estimated) elevation.
            std::size_t k = 0;
            while (sPoint.asSlots[k].nFlag != 1) ++k;
            const PointSlot& sSlot = sPoint.asSlots[k];
            const GroundTerms s =
                ImageToGround(sAdj.asImages[k].sTerms, sSlot.dfXc, sSlot.dfYc, dfZ0);
            sPoint.dfEstX = s.dfX;
            sPoint.dfEstY = s.dfY;
            sPoint.dfEstZ = sPoint.cType == 'X' ? 0.0 : dfZ0;
            const bool bControl = sPoint.cType == 'X' || sPoint.cType == 'P';
            sPoint.dfResX = bControl ? sPoint.dfX - s.dfX : 0.0;
            sPoint.dfResY = bControl ? sPoint.dfY - s.dfY : 0.0;
            sPoint.dfResZ = 0.0;
            continue;
        }
        const Intersection sMeet = Intersect(sAdj, sPoint, dfZ0);
        sPoint.dfEstX = sMeet.dfX;
        sPoint.dfEstY = sMeet.dfY;
        sPoint.dfEstZ = sMeet.dfZ;
        const bool bControl = sPoint.cType == 'X' || sPoint.cType == 'P';
        sPoint.dfResX = bControl ? sPoint.dfX - sMeet.dfX : sMeet.dfMeanAbsX;
        sPoint.dfResY = bControl ? sPoint.dfY - sMeet.dfY : sMeet.dfMeanAbsY;
        sPoint.dfResZ = bKnownZ ? sPoint.dfZ - sMeet.dfZ : 0.0;
    }
}

}  // namespace srit
}  // namespace lumo
