#include <pybind11/numpy.h>
#include <pybind11/pybind11.h>
#include <pybind11/stl.h>

#include <calmframe.hpp>
#include <cstdint>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <utility>
#include <vector>

// What the module calmframe stands on: the library's calls, with arrays for images. Shapes and
// types are checked there.
namespace calmframe::python {
namespace py = pybind11;
namespace {

using Planes = std::vector<py::array>;

py::dict DictOf(const calmframe_shake& shake) {
  py::dict dict;
  dict["mean"] = shake.mean;
  dict["p95"] = shake.p95;
  dict["worst"] = shake.worst;
  dict["worst_at"] = shake.worst_at;
  return dict;
}

py::dict DictOf(const calmframe_outcome& outcome) {
  constexpr const char* kWindows[] = {"steady", "follow", "none"};
  py::dict dict;
  dict["window"] = kWindows[outcome.window];
  dict["bends"] = outcome.bends != 0;
  dict["width_kept"] = outcome.width_kept;
  dict["most_zoom"] = outcome.most_zoom;
  dict["most_black"] = outcome.most_black;
  dict["decibels"] = outcome.decibels;
  dict["before"] = DictOf(outcome.before);
  dict["after"] = DictOf(outcome.after);
  dict["wobble_before"] = outcome.wobble_before;
  dict["wobble_after"] = outcome.wobble_after;
  dict["tracks_before"] = outcome.tracks_before;
  dict["tracks_after"] = outcome.tracks_after;
  return dict;
}

class Binding {
 public:
  Binding(const py::dict& given, py::object fetch) : fetch_(std::move(fetch)) {
    Options options;
    const auto number = [&given](const char* name, auto& member) {
      if (given.contains(name)) {
        member = given[name].cast<std::remove_reference_t<decltype(member)>>();
      }
    };
    number("width", options.width);
    number("height", options.height);
    number("format", options.format);
    number("depth", options.depth);
    number("matrix", options.matrix);
    number("full_range", options.full_range);
    number("chroma_location", options.chroma_location);
    number("aspect_num", options.aspect_num);
    number("aspect_den", options.aspect_den);
    number("rate_num", options.rate_num);
    number("rate_den", options.rate_den);
    number("field_order", options.field_order);
    number("frame_count", options.frame_count);
    number("shots", options.shots);
    std::vector<std::int64_t> starts;
    number("shot_starts", starts);
    options.shot_starts = starts.data();
    options.shot_start_count = starts.size();
    std::string texts[3];
    const char** const members[] = {&options.clip, &options.identity, &options.plugin};
    constexpr const char* kNames[] = {"clip", "identity", "plugin"};
    for (int i = 0; i < 3; ++i) {
      if (!given.contains(kNames[i])) continue;
      texts[i] = given[kNames[i]].cast<std::string>();
      *members[i] = texts[i].c_str();
    }
    width_ = options.width;
    height_ = options.height;
    const py::gil_scoped_release release;
    if (fetch_.is_none()) {
      session_.emplace(options);
    } else {
      session_.emplace(options, [this](std::int64_t frame, const calmframe_image& image) {
        Fetch(frame, image);
      });
    }
  }
  ~Binding() { Close(); }
  Binding(const Binding&) = delete;
  Binding& operator=(const Binding&) = delete;

  void Close() {
    const py::gil_scoped_release release;  // a thread of the session's may be fetching
    session_->Close();
  }

  // act(session), while other threads of Python run. What `fetch` raised is raised in place of what
  // it led to.
  template <class Act>
  auto Do(const Act& act) {
    try {
      const py::gil_scoped_release release;
      return act(*session_);
    } catch (const Error& error) {
      if (error.code == CALMFRAME_ERROR_SOURCE) Raise();
      throw;
    }
  }

  bool Push(std::int64_t frame, const Planes& planes, bool waits) {
    const calmframe_image image = ImageOf(planes);
    return Do([&](Session& session) {
      if (!waits) return session.TryPush(frame, image);
      session.Push(frame, image);
      return true;
    });
  }

  void Render(std::int64_t frame, const std::optional<Planes>& source, const Planes& out) {
    const calmframe_image to = ImageOf(out);
    const calmframe_image from = source ? ImageOf(*source) : calmframe_image{};
    Do([&](Session& session) {
      source ? session.Render(frame, from, to) : session.Render(frame, to);
    });
  }

  py::array_t<double> Path(std::int64_t first, std::int64_t count) {
    static_assert(sizeof(calmframe_place) == 16 * sizeof(double));
    py::array_t<double> path({static_cast<py::ssize_t>(count), py::ssize_t{16}});
    const std::vector<calmframe_place> places =
        Do([&](Session& session) { return session.Path(first, count); });
    std::copy_n(reinterpret_cast<const double*>(places.data()), 16 * places.size(),
                path.mutable_data());
    return path;
  }

  py::list Shots() {
    py::list list;
    for (const calmframe_shot& shot : Do([](Session& session) { return session.shots(); })) {
      py::dict dict = DictOf(shot.outcome);
      dict["first"] = shot.first;
      dict["end"] = shot.end;
      dict["solved"] = shot.solved != 0;
      list.append(dict);
    }
    return list;
  }

  py::dict Progress() {
    const calmframe_progress progress = Do([](Session& session) { return session.progress(); });
    py::dict dict;
    dict["stage"] = progress.stage;
    dict["shot"] = progress.shot;
    dict["done"] = progress.done;
    dict["total"] = progress.total;
    dict["says"] = progress.says;
    return dict;
  }

  py::bytes Save() {
    const std::vector<unsigned char> bytes = Do([](Session& session) { return session.Save(); });
    return py::bytes(reinterpret_cast<const char*>(bytes.data()), bytes.size());
  }
  void Load(const std::string& bytes) {
    Do([&](Session& session) {
      session.Load(std::vector<unsigned char>(bytes.begin(), bytes.end()));
    });
  }

 private:
  calmframe_image ImageOf(const Planes& planes) const {
    calmframe_image image{};
    image.width = width_;
    image.height = height_;
    for (std::size_t p = 0; p < planes.size() && p < 3; ++p) {
      image.plane[p] = const_cast<void*>(planes[p].data());
      image.stride[p] = planes[p].strides(0);
    }
    return image;
  }

  // On a thread of the session's. fetch(frame, planes): a list of a pointer and a distance of rows
  // for each plane.
  void Fetch(std::int64_t frame, const calmframe_image& image) {
    const py::gil_scoped_acquire acquire;
    try {
      py::list planes;
      for (int p = 0; p < 3 && image.plane[p]; ++p) {
        planes.append(py::make_tuple(reinterpret_cast<std::uintptr_t>(image.plane[p]),
                                     static_cast<std::int64_t>(image.stride[p])));
      }
      fetch_(frame, planes);
    } catch (py::error_already_set& error) {
      raised_ = error.value();
      throw std::runtime_error("fetch raised");
    }
  }

  void Raise() {
    const py::object raised = std::exchange(raised_, py::object());
    if (!raised) return;
    PyErr_SetObject(py::type::of(raised).ptr(), raised.ptr());
    throw py::error_already_set();
  }

  int width_ = 0, height_ = 0;
  py::object fetch_, raised_;
  std::optional<Session> session_;
};

}  // namespace

PYBIND11_MODULE(_calmframe, module) {
  static py::exception<Error> error(module, "Error");
  py::register_exception_translator([](std::exception_ptr thrown) {
    try {
      if (thrown) std::rethrow_exception(thrown);
    } catch (const Error& failure) {
      const py::object raised = py::reinterpret_borrow<py::object>(error)(failure.what());
      raised.attr("code") = calmframe_result_name(failure.code);
      PyErr_SetObject(error.ptr(), raised.ptr());
    }
  });
  module.def("version", &calmframe_version);
  py::class_<Binding>(module, "Session")
      .def(py::init<const py::dict&, py::object>())
      .def("close", &Binding::Close)
      .def("set", [](Binding& b, const std::string& name,
                     const std::string& value) { b.Do([&](Session& s) { s.Set(name, value); }); })
      .def("controls", [](Binding& b) { return b.Do([](Session& s) { return s.Controls(); }); })
      .def("start", [](Binding& b) { b.Do([](Session& s) { s.Start(); }); })
      .def("push", &Binding::Push)
      .def("finish", [](Binding& b) { b.Do([](Session& s) { s.Finish(); }); })
      .def("wait",
           [](Binding& b, std::int64_t milliseconds) {
             return b.Do([&](Session& s) { return s.Wait(milliseconds); });
           })
      .def("cancel", [](Binding& b) { b.Do([](Session& s) { s.Cancel(); }); })
      .def("state", [](Binding& b) { return b.Do([](Session& s) { return s.state(); }); })
      .def("progress", &Binding::Progress)
      .def("shots", &Binding::Shots)
      .def("outcome",
           [](Binding& b) { return DictOf(b.Do([](Session& s) { return s.outcome(); })); })
      .def("path", &Binding::Path)
      .def("report", [](Binding& b) { return b.Do([](Session& s) { return s.Report(); }); })
      .def("render", &Binding::Render)
      .def("save", &Binding::Save)
      .def("save_file",
           [](Binding& b, const std::string& path) { b.Do([&](Session& s) { s.Save(path); }); })
      .def("load", &Binding::Load)
      .def("load_file",
           [](Binding& b, const std::string& path) { b.Do([&](Session& s) { s.Load(path); }); });
}

}  // namespace calmframe::python
