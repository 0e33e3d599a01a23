// Work on many objects that is shared out to processes, and looks as if one of them had done it.
// Processes, since the library keeps state of its own in each.
#ifndef MAVOEA_TOOLS_WALK_CREW_H_
#define MAVOEA_TOOLS_WALK_CREW_H_

#include <sys/types.h>

#include <chrono>
#include <cstdint>
#include <deque>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "tools/place/volume.h"
#include "tools/say/messages.h"
#include "tools/walk/journal.h"

namespace mavoea::tool {

// How many processes work on what there is to do.
struct CrewSize {
    unsigned workers = 1;
    // So many objects at a time are done by the first process, until they take it so long that it
    // is worth the trouble to share out the rest. 0: it is.
    std::uint64_t alone = 0;
};
// One for each processor that this process may run on, at most 8, once there is enough to do.
CrewSize UsualCrew();

// What somebody of the crew is to do.
struct Errand {
    enum class Kind : std::uint8_t { kNamed, kFound, kDirectory, kPair };

    Kind kind = Kind::kFound;
    Object object = {};      // kDirectory: only its directory counts; kPair: only its place
    mode_t type = 0;         // S_IFREG, ...
    std::string shown = {};  // empty: the object's own path
    Place to = {};           // kPair: the second one
    // Only in the first process, after all errands before it: what it does may meet what others do.
    bool here = false;
    std::uint64_t state = 0;  // of the object: a log has it as done in that one only
};

// Tells the process that began the work what came of it. That gets it in the order of the errands.
using Tell = std::function<void(std::string_view)>;

struct Duties {
    // In any of the processes. What it writes to std::cout and std::cerr, and what it tells, comes
    // out of the first process, in the order of the errands. Whether it is done: otherwise those
    // who go on with a log do it again. Throws nothing.
    std::function<bool(const Errand&, const Tell&)> work;

    // All else in the first process.
    std::function<void(std::string_view)> hear;
    std::function<void(const std::string& path, const Failure&)> on_failure;
    // Before anything is written, and now and then with an object in hand.
    std::function<void()> clear_progress;
    std::function<void(const Object&)> show_progress;
    // What has been done is on disk.
    std::function<void()> sync = [] {};
};

// Whether what one process does to an object of this name never meets what another does to a second
// one in the same directory: names of metadata that are derived from long ones may be the same.
bool IsApart(const std::string& name);

// Whether this process is one beside the first.
bool IsWorker();

// Errands are done in any order, a bounded number at a time: what came of each waits until all that
// stand before it are done. An errand whose process dies is one failure; the rest is done by
// others. Processes beside the first one leave EA directories that have become empty: another may
// be about to write into it.
class Crew {
 public:
    // With a journal, which stays the caller's, what is done is noted there, and what it has is not
    // done again: only what came of it comes out once more.
    Crew(CrewSize size, Duties duties, Journal* journal = nullptr);
    ~Crew();
    Crew(const Crew&) = delete;
    Crew& operator=(const Crew&) = delete;

    // False when it was done before.
    bool Do(Errand errand);
    // Called in this process, after all that came of the errands before it is out: soon, or when
    // the errands around it are out as well.
    void Then(std::function<void()> step);
    void Afterwards(std::function<void()> step);
    // Whether others may have left EA directories that are empty. Asked in such a step.
    bool LeftEaDirectories() const { return left_ea_directories_; }
    // Returns when everything is done, and out.
    void Finish();

    // For what the first process does by itself, in a step.
    std::optional<std::string> FormerResult(const std::string& key) const;
    void NoteDone(const std::string& key, std::string_view result);

 private:
    struct Area;
    struct Slot;
    struct Batch;
    struct Worker;

    bool GoesOnAlone();
    bool Begin();
    bool StartWorker();
    void CloseBatch();
    void Assign();
    static bool Give(Worker* worker, const std::shared_ptr<Batch>& batch);
    void DoAlone(const Errand& errand);
    void DoHere(const Errand& errand);
    void DoHere(const Batch& batch);
    void NoteDone(std::size_t count);
    void Wait();
    void Hear(Worker* worker);
    void Bury(Worker* worker);
    static void Collect(Worker* worker);
    void Output();
    void Say(std::string_view results);
    template <class Work>
    void Guard(Work work);
    static void LetGoOn(Worker* worker);
    bool MayCollect(const Worker& worker) const;

    CrewSize size_;
    Duties duties_;
    Journal* journal_;
    std::uint64_t done_alone_ = 0;  // errands, since the last look at how long they take
    std::chrono::steady_clock::duration took_{};
    bool shared_out_ = false;
    std::uint64_t batches_ = 0;
    std::vector<std::unique_ptr<Worker>> workers_;
    std::size_t steps_ = 0;                      // that have not been called
    std::shared_ptr<Batch> open_;                // that further errands come to
    std::deque<std::shared_ptr<Batch>> ready_;   // that nobody has taken yet
    std::deque<std::shared_ptr<Slot>> outputs_;  // in the order in which they come out
    std::string told_;                           // the beginning of what somebody tells
    bool in_line_ = false;                       // what has come out ends in the middle of one
    bool left_ea_directories_ = false;
};

}  // namespace mavoea::tool

#endif  // MAVOEA_TOOLS_WALK_CREW_H_
