#pragma once
// The fields beside the number and point inputs that expressions read (n1,
// p1x ...), as the Custom tool and the Expression modifier carry them: for
// each input a name field, which gives the variable a second name and joins
// the input's label ("Number In 1: gain"), and a switch that shows or hides
// the input, in a fold "Number Controls" or "Point Controls".
//
// Thread safety: Add and Notify on the main thread; Names on the render thread.
#include <string>
#include <vector>

namespace Orvane {

class Input;
class Operator;
class Parameter;
class Request;

class VariableFields {
public:
    /// Adds the fold "KIND Controls" ("Number", "Point") with a name field "Name for KIND k" and a switch
    /// "Show KIND k" for each of `inputs`, on `page` (-1: the page inputs go on now).
    void Add(Operator *op, const char *kind, std::vector<Input *> inputs, int page = -1);
    /// A changed field: a switch shows or hides its input, a name joins its label. False when `in` is none of them.
    bool Notify(const Input *in, const Parameter *param) const;
    /// The names typed in the fields for `req`, in input order ("" where none).
    std::vector<std::string> Names(const Request *req) const;

private:
    std::string kind_;
    std::vector<Input *> inputs_, names_, shows_;
};

/// The text a text input holds for `req` ("" for none).
std::string TextOf(const Request *req, const Input *in);
/// A new random seed in 0..32767 other than `current`, for a Reseed button.
double NewRandomSeed(double current);

} // namespace Orvane
