#pragma once
// tde4_ld_plugin: the interface through which a tool sees one lens model.
//
// A model has a name, a list of typed parameters with defaults and ranges, and
// maps positions in normalised coordinates (0 to 1 across the filmback) both
// ways: undistort is the model's direct function, distort its inverse (found
// iteratively, optionally from a caller's start value). Parameters are set by
// name; initializeParameters must run after a change before the model is used.
//
// Thread safety: the setters and initializeParameters belong to one thread;
// afterwards undistort, distort, the Jacobian and the bounding boxes may run on
// many threads at once.
#include <string>

#include "operators/warp/ldpk/LdpkTypes.h"

namespace Orvane {

class tde4_ld_plugin {
public:
    virtual ~tde4_ld_plugin() = default;

    virtual const char *getModelName() const = 0;
    virtual int getNumParameters() const = 0;
    /// The name of parameter i, or nullptr when i is outside the list.
    virtual const char *getParameterName(int i) const = 0;
    virtual bool getParameterType(const char *identifier, ldpk::parameter_type &type) const = 0;
    /// Whether the parameter has a default value to offer.
    virtual bool hasParameterDefault(const char *identifier) const = 0;
    virtual bool getParameterDefaultValue(const char *identifier, bool &v) const = 0;
    virtual bool getParameterDefaultValue(const char *identifier, int &v) const = 0;
    virtual bool getParameterDefaultValue(const char *identifier, std::string &v) const = 0;
    virtual bool getParameterDefaultValue(const char *identifier, double &v) const = 0;
    virtual bool getParameterRange(const char *identifier, double &a, double &b) const = 0;
    virtual bool setParameterValue(const char *identifier, bool v) = 0;
    virtual bool setParameterValue(const char *identifier, int v) = 0;
    virtual bool setParameterValue(const char *identifier, const char *v) = 0;
    virtual bool setParameterValue(const char *identifier, double v) = 0;
    virtual bool initializeParameters() = 0;

    /// The direct function: distorted (x0, y0) to undistorted (x1, y1).
    virtual bool undistort(double x0, double y0, double &x1, double &y1) = 0;
    /// The inverse, iterated from the start (x1_start, y1_start) near the answer.
    virtual bool distort(double x0, double y0, double x1_start, double y1_start, double &x1, double &y1) = 0;
    /// The inverse, iterated from a start the model finds itself.
    virtual bool distort(double x0, double y0, double &x1, double &y1) = 0;

    virtual bool providesJacobianMatrix() const { return false; }
    virtual bool providesTwistVector() const { return false; }
    /// d(undistort)/d(x0, y0) at (x0, y0).
    virtual bool getJacobianMatrix(double, double, double &m00, double &m01, double &m10, double &m11) {
        m00 = m11 = 1.0;
        m01 = m10 = 0.0;
        return false;
    }
    /// Derivatives of the Jacobian; no model of the kit gives them.
    virtual bool getTwistVector(double, double, double &t0, double &t1, double &t2, double &t3) {
        t0 = t1 = t2 = t3 = 0.0;
        return false;
    }
    /// The box holding the image of the box (xa, ya)-(xb, yb) under undistort (or distort).
    virtual bool getBoundingBoxUndistorted(double xa, double ya, double xb, double yb, double &xa_out, double &ya_out,
                                           double &xb_out, double &yb_out) = 0;
    virtual bool getBoundingBoxDistorted(double xa, double ya, double xb, double yb, double &xa_out, double &ya_out,
                                         double &xb_out, double &yb_out) = 0;
};

} // namespace Orvane
