// Generic evaluation of rows and blocks of points through the point operations
// of any math model. Blocks are evaluated exactly on a coarse grid and filled
// by checked bilinear interpolation, which is what makes orthorectification
// of large rasters affordable with expensive models.

#include "nova/mathmodel_core.h"

#include <algorithm>
#include <atomic>
#include <cmath>
#include <cstddef>
#include <string>
#include <vector>

#include "nova/parallel.h"
#include "nova/runtime.h"

namespace nova {
namespace mathmodel {

IMathModel::~IMathModel() = default;

namespace {

// Error number of the host catalogue for invalid or inconsistent input.

// Height offset of the finite difference that gives d(output)/d(height) at a
// grid node. Models are close to linear in height over tens of metres.
constexpr double kHeightDelta = 10.0;

// Cells narrower than this are evaluated exactly: splitting them further
// would cost more check evaluations than the points they hold.
constexpr int kMinSplitSize = 4;

// Fewest points a worker thread is given: below this, starting the thread
// costs about as much as the points it would take over.
constexpr std::size_t kMinPointsPerThread = 4096;

enum class Direction { kImageToGround, kGroundToImage };

const char* FunctionName(Direction eDir) {
    return eDir == Direction::kImageToGround ? "nova::mathmodel::ImageToGround"
                                             : "nova::mathmodel::GroundToImage";
}

// Bad arguments are reported as a numbered warning and make the call fail.
int RejectArguments(Direction eDir, const std::string& osWhat) {
    const std::string osText = FormatString("%s: %s", FunctionName(eDir), osWhat.c_str());
    IMPError(nova::kMsgInvalidInput, 0, osText.c_str());
    return -1;
}

// A coordinate or height that can be handed to a model: finite and not the
// null value (in double or in its float rounding).
bool IsUsableValue(double dfValue) {
    return std::isfinite(dfValue) && dfValue != kMathModelNullValue &&
           dfValue != static_cast<double>(static_cast<float>(kMathModelNullValue));
}

// One model and direction; every point goes through the model's point
// operation and a result counts only when it is finite.
class PointEvaluator {
  public:
    PointEvaluator(const IMathModel* poModel, Direction eDir, bool bFlag)
        : mpoModel(poModel), meDir(eDir), mbFlag(bFlag) {}

    bool Evaluate(double dfIn1, double dfIn2, double dfZ, double& dfOut1, double& dfOut2) const {
        if (!IsUsableValue(dfIn1) || !IsUsableValue(dfIn2) || !IsUsableValue(dfZ)) return false;
        double dfA = 0.0;
        double dfB = 0.0;
        const int nResult = meDir == Direction::kImageToGround
                                ? mpoModel->ImageToGround(dfIn1, dfIn2, dfZ, dfA, dfB, mbFlag)
                                : mpoModel->GroundToImage(dfIn1, dfIn2, dfZ, dfA, dfB, mbFlag);
        if (nResult != 0 || !std::isfinite(dfA) || !std::isfinite(dfB)) return false;
        dfOut1 = dfA;
        dfOut2 = dfB;
        return true;
    }

  private:
    const IMathModel* mpoModel;
    Direction meDir;
    bool mbFlag;
};

// ---------------------------------------------------------------------------
// Array form
// ---------------------------------------------------------------------------

int EvaluateArray(const IMathModel* poModel, Direction eDir, double dfFixed, double dfZ, int nCount,
                  const double* padfIn, double* padfOut1, double* padfOut2, int* panValid,
                  bool bFlag) {
    if (poModel == nullptr) return RejectArguments(eDir, "null math model");
    if (nCount < 0) return RejectArguments(eDir, FormatString("negative point count %d", nCount));
    if (nCount > 0 && (padfIn == nullptr || padfOut1 == nullptr || padfOut2 == nullptr))
        return RejectArguments(eDir, "null coordinate array");

    const PointEvaluator oEval(poModel, eDir, bFlag);
    std::atomic<int> nFailed{0};
    const auto EvaluateRange = [&](std::size_t nBegin, std::size_t nEnd) {
        int nRangeFailed = 0;
        for (std::size_t i = nBegin; i < nEnd; ++i) {
            double dfOut1 = kMathModelNullValue;
            double dfOut2 = kMathModelNullValue;
            // The row's fixed coordinate is the second input in both
            // directions (line, resp. ground Y).
            const bool bOk = oEval.Evaluate(padfIn[i], dfFixed, dfZ, dfOut1, dfOut2);
            if (!bOk) {
                dfOut1 = kMathModelNullValue;
                dfOut2 = kMathModelNullValue;
                ++nRangeFailed;
            }
            padfOut1[i] = dfOut1;
            padfOut2[i] = dfOut2;
            if (panValid != nullptr) panValid[i] = bOk ? 1 : 0;
        }
        nFailed += nRangeFailed;
    };
    ForEachRange(static_cast<std::size_t>(nCount), kMinPointsPerThread, EvaluateRange);
    return nFailed == 0 ? 0 : -1;
}

// ---------------------------------------------------------------------------
// Block form
// ---------------------------------------------------------------------------

// Read access to the points of a block: explicit arrays or a regular grid.
struct BlockInput {
    int nCols;
    const float* pafIn1;
    const float* pafIn2;
    const float* pafZ;
    double dfOrigin1;
    double dfOrigin2;
    double dfStep1;
    double dfStep2;

    std::size_t Index(int nCol, int nRow) const {
        return static_cast<std::size_t>(nRow) * static_cast<std::size_t>(nCols) +
               static_cast<std::size_t>(nCol);
    }
    bool HasArrays() const { return pafIn1 != nullptr; }
    double In1(int nCol, int nRow) const {
        return HasArrays() ? pafIn1[Index(nCol, nRow)] : dfOrigin1 + nCol * dfStep1;
    }
    double In2(int nCol, int nRow) const {
        return HasArrays() ? pafIn2[Index(nCol, nRow)] : dfOrigin2 + nRow * dfStep2;
    }
    double Z(int nCol, int nRow) const { return pafZ != nullptr ? pafZ[Index(nCol, nRow)] : 0.0; }
};

// Write access to the results of a block; counts the failed points.
struct BlockOutput {
    int nCols;
    float* pafOut1;
    float* pafOut2;
    unsigned char* pabyValid;
    std::size_t nFailed;

    void Set(int nCol, int nRow, bool bOk, double dfOut1, double dfOut2) {
        const std::size_t i = static_cast<std::size_t>(nRow) * static_cast<std::size_t>(nCols) +
                              static_cast<std::size_t>(nCol);
        pafOut1[i] = static_cast<float>(bOk ? dfOut1 : kMathModelNullValue);
        pafOut2[i] = static_cast<float>(bOk ? dfOut2 : kMathModelNullValue);
        if (pabyValid != nullptr) pabyValid[i] = bOk ? 1 : 0;
        if (!bOk) ++nFailed;
    }
};

// A point evaluated exactly, with the height derivative of its result so
// that it can anchor an interpolation.
struct Node {
    int nCol = 0;
    int nRow = 0;
    double dfIn1 = 0.0;
    double dfIn2 = 0.0;
    double dfZ = 0.0;
    double dfOut1 = 0.0;
    double dfOut2 = 0.0;
    double dfDz1 = 0.0;  // d(out1)/d(height)
    double dfDz2 = 0.0;
    bool bOk = false;      // the model succeeded at the node
    bool bUsable = false;  // bOk and the height derivative is known
};

// The rectangle of points between four nodes. Points on its last column and
// row belong to the next cell unless the cell is the last of its line.
struct Cell {
    const Node* poTL;
    const Node* poTR;
    const Node* poBL;
    const Node* poBR;
    bool bLastCol;
    bool bLastRow;

    int Col0() const { return poTL->nCol; }
    int Col1() const { return poTR->nCol; }
    int Row0() const { return poTL->nRow; }
    int Row1() const { return poBL->nRow; }
    int WriteColEnd() const { return bLastCol ? Col1() + 1 : Col1(); }
    int WriteRowEnd() const { return bLastRow ? Row1() + 1 : Row1(); }
};

// Bilinear weights of the four corners at a point of a cell.
struct Weights {
    double adf[4];  // top-left, top-right, bottom-left, bottom-right
};

// The interpolating surface of one cell: bilinear in the point's position in
// the block, corrected to first order for the point's height and, with
// explicit input arrays, for the point's departure from the bilinear surface
// of the corner inputs.
class CellInterpolator {
  public:
    CellInterpolator(const Cell& oCell, bool bUseInputs)
        : moCell(oCell),
          mapoNode{oCell.poTL, oCell.poTR, oCell.poBL, oCell.poBR},
          mbUseInputs(bUseInputs),
          mdfInvWidth(1.0 / (oCell.Col1() - oCell.Col0())),
          mdfInvHeight(1.0 / (oCell.Row1() - oCell.Row0())) {
        for (int i = 0; i < 4; ++i) {
            const Node& oNode = *mapoNode[i];
            const double adfValue[kFieldCount] = {oNode.dfOut1, oNode.dfOut2, oNode.dfDz1,
                                                  oNode.dfDz2,  oNode.dfZ,    oNode.dfIn1,
                                                  oNode.dfIn2};
            for (int f = 0; f < kFieldCount; ++f) madfCorner[f][i] = adfValue[f];
        }
        if (mbUseInputs) FitInputJacobian();
    }

    // False when the point's input lies too far off the corners' surface for
    // the linear correction to be trusted.
    bool Interpolate(int nCol, int nRow, double dfIn1, double dfIn2, double dfZ, double& dfOut1,
                     double& dfOut2) const {
        const Weights oW = WeightsAt(nCol, nRow);
        const double dfDz = dfZ - Blend(oW, kZ);
        dfOut1 = Blend(oW, kOut1) + Blend(oW, kDz1) * dfDz;
        dfOut2 = Blend(oW, kOut2) + Blend(oW, kDz2) * dfDz;
        if (!mbUseInputs) return true;
        const double dfD1 = dfIn1 - Blend(oW, kIn1);
        const double dfD2 = dfIn2 - Blend(oW, kIn2);
        if (std::fabs(dfD1) > mdfLimit1 || std::fabs(dfD2) > mdfLimit2) return false;
        dfOut1 += madfJ[0] * dfD1 + madfJ[1] * dfD2;
        dfOut2 += madfJ[2] * dfD1 + madfJ[3] * dfD2;
        return true;
    }

  private:
    // Corner values blended per point, in one array for a tight inner loop.
    enum Field { kOut1, kOut2, kDz1, kDz2, kZ, kIn1, kIn2, kFieldCount };

    Weights WeightsAt(int nCol, int nRow) const {
        const double dfS = (nCol - moCell.Col0()) * mdfInvWidth;
        const double dfT = (nRow - moCell.Row0()) * mdfInvHeight;
        return Weights{{(1 - dfS) * (1 - dfT), dfS * (1 - dfT), (1 - dfS) * dfT, dfS * dfT}};
    }

    double Blend(const Weights& oW, Field eField) const {
        const double* padf = madfCorner[eField];
        return oW.adf[0] * padf[0] + oW.adf[1] * padf[1] + oW.adf[2] * padf[2] +
               oW.adf[3] * padf[3];
    }

    // Jacobian d(out)/d(in) of the cell from its two corner triangles, each
    // spanned by two edges; degenerate triangles contribute nothing.
    void FitInputJacobian() {
        double adfSum[4] = {0, 0, 0, 0};
        int nFits = 0;
        nFits += AddTriangleJacobian(*moCell.poTL, *moCell.poTR, *moCell.poBL, adfSum);
        nFits += AddTriangleJacobian(*moCell.poBR, *moCell.poBL, *moCell.poTR, adfSum);
        for (int i = 0; i < 4; ++i) madfJ[i] = nFits > 0 ? adfSum[i] / nFits : 0.0;

        // Departures beyond a quarter of the cell's input extent are evaluated
        // exactly rather than extrapolated.
        mdfLimit1 = 0.25 * Extent(&Node::dfIn1);
        mdfLimit2 = 0.25 * Extent(&Node::dfIn2);
    }

    double Extent(double Node::*pField) const {
        double dfMin = mapoNode[0]->*pField;
        double dfMax = dfMin;
        for (const Node* poNode : mapoNode) {
            dfMin = std::min(dfMin, poNode->*pField);
            dfMax = std::max(dfMax, poNode->*pField);
        }
        return dfMax - dfMin;
    }

    int AddTriangleJacobian(const Node& oA, const Node& oB, const Node& oC, double* padfSum) const {
        const double dfE11 = oB.dfIn1 - oA.dfIn1;
        const double dfE12 = oB.dfIn2 - oA.dfIn2;
        const double dfE21 = oC.dfIn1 - oA.dfIn1;
        const double dfE22 = oC.dfIn2 - oA.dfIn2;
        const double dfDet = dfE11 * dfE22 - dfE21 * dfE12;
        const double dfScale = std::hypot(dfE11, dfE12) * std::hypot(dfE21, dfE22);
        if (!(std::fabs(dfDet) > 1e-9 * dfScale)) return 0;

        // Output differences with the height effect taken out.
        const double dfDz1 = 0.5 * (oA.dfDz1 + oB.dfDz1);
        const double dfDz2 = 0.5 * (oA.dfDz2 + oB.dfDz2);
        const double dfF11 = oB.dfOut1 - oA.dfOut1 - dfDz1 * (oB.dfZ - oA.dfZ);
        const double dfF12 = oB.dfOut2 - oA.dfOut2 - dfDz2 * (oB.dfZ - oA.dfZ);
        const double dfF21 = oC.dfOut1 - oA.dfOut1 - dfDz1 * (oC.dfZ - oA.dfZ);
        const double dfF22 = oC.dfOut2 - oA.dfOut2 - dfDz2 * (oC.dfZ - oA.dfZ);

        // J * [e1 e2] = [f1 f2]  =>  J = [f1 f2] * inverse([e1 e2]).
        const double dfI11 = dfE22 / dfDet;
        const double dfI12 = -dfE21 / dfDet;
        const double dfI21 = -dfE12 / dfDet;
        const double dfI22 = dfE11 / dfDet;
        padfSum[0] += dfF11 * dfI11 + dfF21 * dfI21;
        padfSum[1] += dfF11 * dfI12 + dfF21 * dfI22;
        padfSum[2] += dfF12 * dfI11 + dfF22 * dfI21;
        padfSum[3] += dfF12 * dfI12 + dfF22 * dfI22;
        return 1;
    }

    const Cell& moCell;
    const Node* mapoNode[4];
    bool mbUseInputs;
    double mdfInvWidth;
    double mdfInvHeight;
    double madfCorner[kFieldCount][4] = {};
    double madfJ[4] = {0, 0, 0, 0};
    double mdfLimit1 = 0.0;
    double mdfLimit2 = 0.0;
};

// Evaluation of one block; holds only references to the call's arguments.
class BlockEvaluator {
  public:
    BlockEvaluator(const PointEvaluator& oEval, const BlockInput& oIn, BlockOutput& oOut,
                   double dfTolerance, bool bHeightDerivative)
        : moEval(oEval),
          moIn(oIn),
          moOut(oOut),
          mdfTolerance(dfTolerance),
          mbHeightDerivative(bHeightDerivative) {}

    void EvaluatePoint(int nCol, int nRow) {
        double dfOut1 = 0.0;
        double dfOut2 = 0.0;
        const bool bOk = moEval.Evaluate(moIn.In1(nCol, nRow), moIn.In2(nCol, nRow),
                                         moIn.Z(nCol, nRow), dfOut1, dfOut2);
        moOut.Set(nCol, nRow, bOk, dfOut1, dfOut2);
    }

    void EvaluateRowsExactly(int nCols, int nRowBegin, int nRowEnd) {
        for (int nRow = nRowBegin; nRow < nRowEnd; ++nRow)
            for (int nCol = 0; nCol < nCols; ++nCol) EvaluatePoint(nCol, nRow);
    }

    // A node evaluated at its own input and height; with bDerivative also its
    // height derivative, needed only where it becomes a cell corner.
    Node MakeNode(int nCol, int nRow, bool bDerivative = true) const {
        Node oNode;
        oNode.nCol = nCol;
        oNode.nRow = nRow;
        oNode.dfIn1 = moIn.In1(nCol, nRow);
        oNode.dfIn2 = moIn.In2(nCol, nRow);
        oNode.dfZ = moIn.Z(nCol, nRow);
        oNode.bOk =
            moEval.Evaluate(oNode.dfIn1, oNode.dfIn2, oNode.dfZ, oNode.dfOut1, oNode.dfOut2);
        oNode.bUsable = oNode.bOk && !mbHeightDerivative;
        if (bDerivative) AddHeightDerivative(oNode);
        return oNode;
    }

    // Fills a cell by interpolation when its checks pass, else splits it in
    // four around the check points (which become the parts' corners).
    void ProcessCell(const Cell& oCell) {
        const bool bCornersUsable = oCell.poTL->bUsable && oCell.poTR->bUsable &&
                                    oCell.poBL->bUsable && oCell.poBR->bUsable;
        if (!bCornersUsable || oCell.Col1() - oCell.Col0() < kMinSplitSize ||
            oCell.Row1() - oCell.Row0() < kMinSplitSize) {
            EvaluateCellExactly(oCell);
            return;
        }
        const int nColMid = (oCell.Col0() + oCell.Col1()) / 2;
        const int nRowMid = (oCell.Row0() + oCell.Row1()) / 2;
        Node oTop = MakeNode(nColMid, oCell.Row0(), false);
        Node oBottom = MakeNode(nColMid, oCell.Row1(), false);
        Node oLeft = MakeNode(oCell.Col0(), nRowMid, false);
        Node oRight = MakeNode(oCell.Col1(), nRowMid, false);
        Node oCentre = MakeNode(nColMid, nRowMid, false);

        const CellInterpolator oInterp(oCell, moIn.HasArrays());
        if (Agrees(oInterp, oTop) && Agrees(oInterp, oBottom) && Agrees(oInterp, oLeft) &&
            Agrees(oInterp, oRight) && Agrees(oInterp, oCentre)) {
            InterpolateCell(oCell, oInterp);
            return;
        }
        for (Node* poNode : {&oTop, &oBottom, &oLeft, &oRight, &oCentre})
            AddHeightDerivative(*poNode);
        ProcessCell(Cell{oCell.poTL, &oTop, &oLeft, &oCentre, false, false});
        ProcessCell(Cell{&oTop, oCell.poTR, &oCentre, &oRight, oCell.bLastCol, false});
        ProcessCell(Cell{&oLeft, &oCentre, oCell.poBL, &oBottom, false, oCell.bLastRow});
        ProcessCell(Cell{&oCentre, &oRight, &oBottom, oCell.poBR, oCell.bLastCol, oCell.bLastRow});
    }

  private:
    void AddHeightDerivative(Node& oNode) const {
        if (!oNode.bOk || !mbHeightDerivative) return;
        double dfUp1 = 0.0;
        double dfUp2 = 0.0;
        oNode.bUsable =
            moEval.Evaluate(oNode.dfIn1, oNode.dfIn2, oNode.dfZ + kHeightDelta, dfUp1, dfUp2);
        if (oNode.bUsable) {
            oNode.dfDz1 = (dfUp1 - oNode.dfOut1) / kHeightDelta;
            oNode.dfDz2 = (dfUp2 - oNode.dfOut2) / kHeightDelta;
        }
    }

    bool Agrees(const CellInterpolator& oInterp, const Node& oCheck) const {
        if (!oCheck.bOk) return false;
        double dfOut1 = 0.0;
        double dfOut2 = 0.0;
        if (!oInterp.Interpolate(oCheck.nCol, oCheck.nRow, oCheck.dfIn1, oCheck.dfIn2, oCheck.dfZ,
                                 dfOut1, dfOut2))
            return false;
        return std::fabs(dfOut1 - oCheck.dfOut1) <= mdfTolerance &&
               std::fabs(dfOut2 - oCheck.dfOut2) <= mdfTolerance;
    }

    void EvaluateCellExactly(const Cell& oCell) {
        for (int nRow = oCell.Row0(); nRow < oCell.WriteRowEnd(); ++nRow)
            for (int nCol = oCell.Col0(); nCol < oCell.WriteColEnd(); ++nCol)
                EvaluatePoint(nCol, nRow);
    }

    void InterpolateCell(const Cell& oCell, const CellInterpolator& oInterp) {
        for (int nRow = oCell.Row0(); nRow < oCell.WriteRowEnd(); ++nRow) {
            for (int nCol = oCell.Col0(); nCol < oCell.WriteColEnd(); ++nCol) {
                const double dfIn1 = moIn.In1(nCol, nRow);
                const double dfIn2 = moIn.In2(nCol, nRow);
                const double dfZ = moIn.Z(nCol, nRow);
                double dfOut1 = 0.0;
                double dfOut2 = 0.0;
                if (!IsUsableValue(dfIn1) || !IsUsableValue(dfIn2) || !IsUsableValue(dfZ)) {
                    moOut.Set(nCol, nRow, false, 0.0, 0.0);
                } else if (oInterp.Interpolate(nCol, nRow, dfIn1, dfIn2, dfZ, dfOut1, dfOut2)) {
                    moOut.Set(nCol, nRow, true, dfOut1, dfOut2);
                } else {
                    EvaluatePoint(nCol, nRow);
                }
            }
        }
    }

    const PointEvaluator& moEval;
    const BlockInput& moIn;
    BlockOutput& moOut;
    double mdfTolerance;
    bool mbHeightDerivative;
};

// Positions of the coarse grid along one axis: every nStep-th point and the
// last one.
std::vector<int> GridPositions(int nSize, int nStep) {
    std::vector<int> anPos;
    anPos.reserve(static_cast<std::size_t>(nSize / nStep) + 2);
    for (int i = 0; i < nSize - 1; i += nStep) anPos.push_back(i);
    anPos.push_back(nSize - 1);
    return anPos;
}

// The cells between the coarse grid's rows nFirst and nLast (positions in
// anRows). A range starts on its own first row of nodes, so ranges given to
// different threads share nothing but their inputs.
void EvaluateGridRows(BlockEvaluator& oBlock, const std::vector<int>& anCols,
                      const std::vector<int>& anRows, std::size_t nFirst, std::size_t nLast) {
    const std::size_t nNodeCols = anCols.size();

    // Two rows of nodes at a time keep the working storage small.
    std::vector<Node> aoUpper(nNodeCols);
    std::vector<Node> aoLower(nNodeCols);
    for (std::size_t i = 0; i < nNodeCols; ++i)
        aoUpper[i] = oBlock.MakeNode(anCols[i], anRows[nFirst]);
    for (std::size_t j = nFirst; j < nLast; ++j) {
        for (std::size_t i = 0; i < nNodeCols; ++i)
            aoLower[i] = oBlock.MakeNode(anCols[i], anRows[j + 1]);
        const bool bLastRow = j + 2 == anRows.size();
        for (std::size_t i = 0; i + 1 < nNodeCols; ++i) {
            const bool bLastCol = i + 2 == nNodeCols;
            oBlock.ProcessCell(Cell{&aoUpper[i], &aoUpper[i + 1], &aoLower[i], &aoLower[i + 1],
                                    bLastCol, bLastRow});
        }
        aoUpper.swap(aoLower);
    }
}

bool Overlaps(const float* pafOut, const float* pafIn) {
    return pafOut != nullptr && pafOut == pafIn;
}

int EvaluateBlock(const IMathModel* poModel, Direction eDir, int nCols, int nRows, int nGridStep,
                  const float* pafIn1, const float* pafIn2, const float* pafZ, float* pafOut1,
                  float* pafOut2, unsigned char* pabyValid, double dfOrigin1, double dfOrigin2,
                  double dfStep1, double dfStep2, double dfTolerance, bool bFlag) {
    if (poModel == nullptr) return RejectArguments(eDir, "null math model");
    if (nCols < 0 || nRows < 0)
        return RejectArguments(eDir, FormatString("negative block size %d x %d", nCols, nRows));
    if (nGridStep < 1)
        return RejectArguments(eDir, FormatString("grid step %d is below 1", nGridStep));
    if (std::isnan(dfTolerance)) return RejectArguments(eDir, "tolerance is NaN");
    if ((pafIn1 == nullptr) != (pafIn2 == nullptr))
        return RejectArguments(eDir, "only one of the two input arrays given");
    if (pafIn1 == nullptr && !(std::isfinite(dfOrigin1) && std::isfinite(dfOrigin2) &&
                               std::isfinite(dfStep1) && std::isfinite(dfStep2)))
        return RejectArguments(
            eDir, FormatString("non-finite grid origin (%g, %g) or step (%g, %g)", dfOrigin1,
                               dfOrigin2, dfStep1, dfStep2));
    if (nCols == 0 || nRows == 0) return 0;
    if (pafOut1 == nullptr || pafOut2 == nullptr) return RejectArguments(eDir, "null output array");
    if (pafOut1 == pafOut2 || Overlaps(pafOut1, pafIn1) || Overlaps(pafOut1, pafIn2) ||
        Overlaps(pafOut1, pafZ) || Overlaps(pafOut2, pafIn1) || Overlaps(pafOut2, pafIn2) ||
        Overlaps(pafOut2, pafZ))
        return RejectArguments(eDir, "an output array is also an input or the other output");

    const PointEvaluator oEval(poModel, eDir, bFlag);
    const BlockInput oIn{nCols, pafIn1, pafIn2, pafZ, dfOrigin1, dfOrigin2, dfStep1, dfStep2};
    const bool bExactOnly = !(dfTolerance > 0.0) || nGridStep == 1 || nCols < 3 || nRows < 3;
    const bool bHeightDerivative = !bExactOnly && pafZ != nullptr && poModel->IsHeightDependent();

    // Rows of points (exact evaluation) or rows of grid cells are split
    // across threads; every point is written by exactly one range.
    std::atomic<std::size_t> nFailed{0};
    const auto InRange = [&](auto&& fnWork) {
        BlockOutput oOut{nCols, pafOut1, pafOut2, pabyValid, 0};
        BlockEvaluator oBlock(oEval, oIn, oOut, dfTolerance, bHeightDerivative);
        fnWork(oBlock);
        nFailed += oOut.nFailed;
    };
    const std::size_t nCols64 = static_cast<std::size_t>(nCols);
    if (bExactOnly) {
        ForEachRange(static_cast<std::size_t>(nRows), kMinPointsPerThread / nCols64 + 1,
                     [&](std::size_t nBegin, std::size_t nEnd) {
                         InRange([&](BlockEvaluator& oBlock) {
                             oBlock.EvaluateRowsExactly(nCols, static_cast<int>(nBegin),
                                                        static_cast<int>(nEnd));
                         });
                     });
    } else {
        const std::vector<int> anCols = GridPositions(nCols, nGridStep);
        const std::vector<int> anRows = GridPositions(nRows, nGridStep);
        const std::size_t nPointsPerCellRow = static_cast<std::size_t>(nGridStep) * nCols64;
        ForEachRange(anRows.size() - 1, kMinPointsPerThread / nPointsPerCellRow + 1,
                     [&](std::size_t nBegin, std::size_t nEnd) {
                         InRange([&](BlockEvaluator& oBlock) {
                             EvaluateGridRows(oBlock, anCols, anRows, nBegin, nEnd);
                         });
                     });
    }
    return nFailed == 0 ? 0 : -1;
}

}  // namespace

int ImageToGround(const IMathModel* poModel, double dfFixed, double dfZ, int nCount,
                  const double* padfIn, double* padfOut1, double* padfOut2, int* panValid,
                  bool bFlag) {
    return EvaluateArray(poModel, Direction::kImageToGround, dfFixed, dfZ, nCount, padfIn, padfOut1,
                         padfOut2, panValid, bFlag);
}

int GroundToImage(const IMathModel* poModel, double dfFixed, double dfZ, int nCount,
                  const double* padfIn, double* padfOut1, double* padfOut2, int* panValid,
                  bool bFlag) {
    return EvaluateArray(poModel, Direction::kGroundToImage, dfFixed, dfZ, nCount, padfIn, padfOut1,
                         padfOut2, panValid, bFlag);
}

int ImageToGround(const IMathModel* poModel, int nCols, int nRows, int nGridStep,
                  const float* pafIn1, const float* pafIn2, const float* pafZ, float* pafOut1,
                  float* pafOut2, unsigned char* pabyValid, double dfOrigin1, double dfOrigin2,
                  double dfStep1, double dfStep2, double dfTolerance, bool bFlag) {
    return EvaluateBlock(poModel, Direction::kImageToGround, nCols, nRows, nGridStep, pafIn1,
                         pafIn2, pafZ, pafOut1, pafOut2, pabyValid, dfOrigin1, dfOrigin2, dfStep1,
                         dfStep2, dfTolerance, bFlag);
}

int GroundToImage(const IMathModel* poModel, int nCols, int nRows, int nGridStep,
                  const float* pafIn1, const float* pafIn2, const float* pafZ, float* pafOut1,
                  float* pafOut2, unsigned char* pabyValid, double dfOrigin1, double dfOrigin2,
                  double dfStep1, double dfStep2, double dfTolerance, bool bFlag) {
    return EvaluateBlock(poModel, Direction::kGroundToImage, nCols, nRows, nGridStep, pafIn1,
                         pafIn2, pafZ, pafOut1, pafOut2, pabyValid, dfOrigin1, dfOrigin2, dfStep1,
                         dfStep2, dfTolerance, bFlag);
}

int PointMathModel::ImageToGround(int nCols, int nRows, int nGridStep, const float* pafPixel,
                                  const float* pafLine, const float* pafZ, float* pafX, float* pafY,
                                  unsigned char* pabyValid, double dfOriginPixel,
                                  double dfOriginLine, double dfStepPixel, double dfStepLine,
                                  double dfTolerance, bool bFlag) const {
    return mathmodel::ImageToGround(this, nCols, nRows, nGridStep, pafPixel, pafLine, pafZ, pafX,
                                    pafY, pabyValid, dfOriginPixel, dfOriginLine, dfStepPixel,
                                    dfStepLine, dfTolerance, bFlag);
}

int PointMathModel::ImageToGround(double dfLine, double dfZ, int nCount, const double* padfPixel,
                                  double* padfX, double* padfY, int* panValid, bool bFlag) const {
    return mathmodel::ImageToGround(this, dfLine, dfZ, nCount, padfPixel, padfX, padfY, panValid,
                                    bFlag);
}

int PointMathModel::GroundToImage(int nCols, int nRows, int nGridStep, const float* pafX,
                                  const float* pafY, const float* pafZ, float* pafPixel,
                                  float* pafLine, unsigned char* pabyValid, double dfOriginX,
                                  double dfOriginY, double dfStepX, double dfStepY,
                                  double dfTolerance, bool bFlag) const {
    return mathmodel::GroundToImage(this, nCols, nRows, nGridStep, pafX, pafY, pafZ, pafPixel,
                                    pafLine, pabyValid, dfOriginX, dfOriginY, dfStepX, dfStepY,
                                    dfTolerance, bFlag);
}

int PointMathModel::GroundToImage(double dfY, double dfZ, int nCount, const double* padfX,
                                  double* padfPixel, double* padfLine, int* panValid,
                                  bool bFlag) const {
    return mathmodel::GroundToImage(this, dfY, dfZ, nCount, padfX, padfPixel, padfLine, panValid,
                                    bFlag);
}

}  // namespace mathmodel
}  // namespace nova
