@0x87f6702b009fa1d0;

# The local connection: what travels over the Unix stream socket between a client process and the daemon.
#
# The line. A client connects to the service's socket and asks for the bootstrap capability, which is an `Acceptor`. It
# calls `Acceptor.open` once, and from the answer on both ends hold an `Endpoint` of the other. Both ends are alike:
# each calls the object that the other exports. Bytes, calls and returns are those of stock Cap'n Proto RPC (level 1,
# two parties) with its stream framing; open files are passed as SCM_RIGHTS beside the message that names them.
#
# Who may call. The daemon reads the peer's process, user and groups from the socket and decides with its grants before
# it answers `open`. What a client says about itself plays no part in that.
#
# Bounds. Each of these ends the connection, and the other connections go on:
# - bytes that are none of this, a message of more than 64 MiB, a value nested more than 64 deep, more than 1,048,576
#   values in one message;
# - more than 16 messages or 16 KiB from the connecting side before its `open` is answered, and 30 s without `open`;
# - more than 16 unanswered `deliver` calls;
# - more than 262,144 calls that wait for an answer of the receiver (a `replyID` not 0, and no `Reply` yet);
# - more than 64 descriptors in calls that the receiver has not executed yet;
# - leaving the own side unread until more than 16 MiB wait for it.
#
# Failure. When either process ends or closes the socket, every call that has no answer yet has failed. There is no
# resumption: a new connection is a new session that has been told nothing.

using Cxx = import "/capnp/c++.capnp";
$Cxx.namespace("telvane::wire");

struct Value {
  # One property-list value. A dictionary is a list of values that each bear their key, in the order in which the keys
  # were set; so an entry costs one struct and no pointer of its own.

  key @0 :Text;
  # The key under which this value stands in the dictionary around it. Absent everywhere else. A key that comes twice
  # counts with its last value.

  union {
    none @1 :Void;
    # Absence: an argument that was not given. Inside a dictionary it counts as a missing entry.

    boolean @2 :Bool;

    integer @3 :Int64;

    unsigned @4 :UInt64;
    # Only what does not fit a signed integer: above 2^63 - 1.

    real @5 :Float64;

    string @6 :Text;
    # UTF-8; may hold NUL characters.

    data @7 :Data;

    date @8 :Int64;
    # Microseconds since 1970-01-01T00:00:00Z.

    array @9 :List(Value);

    dictionary @10 :List(Value);
  }
}

interface OpenFile {
  # An open file of the calling process. It has no methods: the descriptor that comes with it is all there is. The
  # receiver takes a descriptor of its own; the caller's may be closed at once.
}

struct Invocation {
  # One call of an operation of the object that the other side exports.

  operation @0 :UInt16;
  # The operation's number: of `ClientSessionOperation` towards the daemon, of `ClientSessionReplyOperation` towards a
  # client. A number that the receiver does not know is dropped with a log line.

  arguments @1 :List(Value);
  # In the order of the operation's own list. Arguments missing at the end count as absent.

  replyID @2 :UInt32;
  # 0: no answer is wanted. Else a number that no other unanswered call of this line bears; the caller chooses.

  descriptor @3 :OpenFile;
  # Absent unless the operation says otherwise. At most 8 in one batch.
}

struct Reply {
  # The answer of one invocation. Each wanted answer comes once: with the batch of its call, or later with `answer`.

  replyID @0 :UInt32;

  dropped @1 :Bool;
  # True when the receiver let the call go unanswered; the caller's error handler then stands for the answer.

  values @2 :List(Value);
  # What the reply block receives, in its order; values missing at the end count as absent. Empty when dropped.
}

interface Acceptor {
  # The bootstrap capability of the listening side.

  open @0 (client :Endpoint) -> (endpoint :Endpoint, accepted :Bool);
  # Called once, first, by the connecting side, with the object that it exports. Answered once the listener has decided.
  # accepted false: refused, there is no endpoint, and the line is closed. accepted true: the line stands, and no call
  # was served before this answer. A second call fails. A line on which it is not called for 30 s is closed.
}

interface Endpoint {
  # One end of an accepted line.

  deliver @0 (invocations :List(Invocation), textBytes :UInt32) -> (replies :List(Reply), textBytes :UInt32);
  # Carries calls, oldest first. They are executed one at a time in this order, behind those of earlier batches.
  # Answered when the last one has been executed, with those replies that are there by then, in the order in which they
  # came. So a caller that keeps at most two batches under way never runs far ahead of its receiver, and a receiver that
  # has no room answers later.
  #
  # textBytes is the sum of the bytes of all strings and keys, so that the reader can place them in one buffer. It is a
  # hint: a wrong one costs time or memory within the bounds above, nothing else.
  #
  # Fails as a whole, with the line, when the batch breaks a bound.

  answer @1 (replies :List(Reply), textBytes :UInt32) -> ();
  # Carries the replies of invocations whose batch has been answered already, oldest first. Answered when they have been
  # read. One call at a time is under way; without any reply in it, it only says that all before it has arrived.
}

enum ClientSessionOperation {
  # What the daemon exports. Reply values are listed behind the arrow; "-" means that no answer is given.
  #
  # A session calls setSessionInfo first; what comes before it finds a session that has been told nothing. One-shot
  # messages need no session info. No operation fails in itself: what is missing or of a wrong type counts as absent,
  # and what cannot be done is said in the reply values.

  none @0;
  # Not an operation.

  setSessionInfo @1;
  # session info :dictionary, user info :dictionary or absent, frameworks to check :array of strings,
  # has aggregation block :boolean -> -

  startConfig @2;
  # (no arguments) -> enabled backend names :array, whitelisted categories :array, blacklisted categories :array
  # Each may be absent; all three are when there is no storebag.

  fetchStates @3;
  # user info :dictionary or absent -> the three of startConfig
  # All absent when too many sessions of the client type are active.

  fetchDisplayURL @4;
  # (no arguments) -> URL :string

  sendMessage @5;
  # message :dictionary -> what the backend returned :any value, absent when nothing was sent

  flushMessages @6;
  # (no arguments) -> result :any value or absent, error :dictionary (domain, code, user info) or absent

  finishSessionGracefully @7;
  # (no arguments) -> -

  uploadFile @8;
  # file URL :string, extension token :data or absent -> whether a backend took the file :boolean
  # The invocation bears the open file as its descriptor; the daemon reads from that, never by the path.

  uploadLogData @9;
  # log data :array of dictionaries -> success :boolean, error :always absent

  sendOneShotMessage @10;
  # session info :dictionary, user info :dictionary, category :integer (16 bits), type :integer (16 bits),
  # payload :dictionary -> status :string

  updateSharedData @11;
  # entries to merge :dictionary -> -

  updateSharedDataForKey @12;
  # key :string, value :any value, absent to remove the key -> -

  setDigestKey @13;
  # digest key :any value, algorithm :integer (signed 32 bits) -> -

  # A number that is not listed has no operation, except for this one, which stands beside the session's own:
  #
  # 32, daemonStatus
  # (no arguments) -> status :dictionary
  # What the daemon is and holds at the moment, without any event's content: version, process, sessions, storebags,
  # memory. For people who look after it; the keys stand in interfaces/AgentKeys.h and may become more.
}

enum ClientSessionReplyOperation {
  # What a client exports that registered an aggregation block.

  none @0;
  # Not an operation.

  sendMessageToClient @1;
  # sending session's session info :dictionary or absent, timestamp :real (seconds since 1970),
  # category :integer (16 bits), type :integer (16 bits), payload :dictionary or absent -> -
  # Category 0, type 0, timestamp 0 and both objects absent: aggregation for that session has ended.
}
