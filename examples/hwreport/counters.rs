// Prints the statistics channels of a device (TALLYRUN_ROOT, or /) from Rust, without crates.
// counters [SECONDS [GROUP]]: what they counted meanwhile, and only those of one group.
use std::ffi::{CStr, CString};
use std::os::raw::{c_char, c_int, c_void};
use std::{env, process, ptr, thread, time::Duration};

// Handles, the constants and functions of hwreport_c.h that are used here.
type Handle = *mut c_void;
const NAME: c_int = 1;
const DRIVER_NAME: c_int = 4;
const UNIT_LABEL: c_int = 5;
const FORMAT: c_int = 1;
const SIMPLE: u64 = 1;
const STATE: u64 = 2;
const HISTOGRAM: u64 = 3;
const MISSING: i64 = i64::MIN;
const ARRAY_VALUES: c_int = 1;
const STATE_RESIDENCIES: c_int = 4;
const BUCKET_HITS: c_int = 5;

#[link(name = "hwreport")]
extern "C" {
    fn hwreport_error_text() -> *const c_char;
    fn hwreport_open(root: *const c_char, device: *mut Handle) -> c_int;
    fn hwreport_close(device: Handle);
    fn hwreport_list(device: Handle, channels: *mut Handle) -> c_int;
    fn hwreport_free(channels: Handle);
    fn hwreport_count(channels: Handle) -> usize;
    fn hwreport_keep_group(channels: Handle, group: *const c_char, sub: *const c_char) -> c_int;
    fn hwreport_text(channels: Handle, index: usize, field: c_int, text: *mut *const c_char) -> c_int;
    fn hwreport_number(channels: Handle, index: usize, field: c_int, number: *mut u64) -> c_int;
    fn hwreport_subscribe(device: Handle, channels: Handle, subscription: *mut Handle) -> c_int;
    fn hwreport_unsubscribe(subscription: Handle);
    fn hwreport_sample(subscription: Handle, sample: *mut Handle) -> c_int;
    fn hwreport_delta(earlier: Handle, later: Handle, delta: *mut Handle) -> c_int;
    fn hwreport_simple_value(channels: Handle, index: usize, value: *mut i64) -> c_int;
    fn hwreport_elements(channels: Handle, index: usize, column: c_int, values: *mut i64,
                         capacity: usize, count: *mut usize) -> c_int;
    fn hwreport_state_name(channels: Handle, index: usize, state: usize,
                           name: *mut *const c_char) -> c_int;
}

fn owned(text: *const c_char) -> String {
    unsafe { CStr::from_ptr(text) }.to_string_lossy().into_owned()
}

fn check(code: c_int) {
    if code != 0 {
        eprintln!("{}", owned(unsafe { hwreport_error_text() }));
        process::exit(1);
    }
}

// A set of channels, freed when it goes out of scope.
struct Channels(Handle);

impl Drop for Channels {
    fn drop(&mut self) {
        unsafe { hwreport_free(self.0) }
    }
}

impl Channels {
    fn made(make: impl FnOnce(*mut Handle) -> c_int) -> Channels {
        let mut handle = ptr::null_mut();
        check(make(&mut handle));
        Channels(handle)
    }

    fn text(&self, index: usize, field: c_int) -> String {
        let mut text = ptr::null();
        unsafe { hwreport_text(self.0, index, field, &mut text) }; // "" if the channel has none
        owned(text)
    }

    fn state_name(&self, index: usize, state: usize) -> String {
        let mut name = ptr::null();
        unsafe { hwreport_state_name(self.0, index, state, &mut name) };
        owned(name)
    }

    fn column(&self, index: usize, what: c_int) -> Vec<i64> {
        let mut count = 0;
        check(unsafe { hwreport_elements(self.0, index, what, ptr::null_mut(), 0, &mut count) });
        let mut values = vec![0; count];
        check(unsafe {
            hwreport_elements(self.0, index, what, values.as_mut_ptr(), count, &mut count)
        });
        values
    }

    fn print(&self, index: usize) {
        let label = format!("{}: {}", self.text(index, DRIVER_NAME), self.text(index, NAME));
        let mut format = 0;
        check(unsafe { hwreport_number(self.0, index, FORMAT, &mut format) });
        if format == SIMPLE {
            let mut value = 0;
            check(unsafe { hwreport_simple_value(self.0, index, &mut value) });
            println!("{} = {} {}", label, value, self.text(index, UNIT_LABEL));
            return;
        }
        let what = match format {
            STATE => STATE_RESIDENCIES,
            HISTOGRAM => BUCKET_HITS,
            _ => ARRAY_VALUES,
        };
        for (i, value) in self.column(index, what).iter().enumerate() {
            if *value == MISSING {
                continue;
            }
            let state = if format == STATE { self.state_name(index, i) } else { String::new() };
            println!("{}[{}] {} = {}", label, i, state, value);
        }
    }
}

fn main() {
    let arguments: Vec<String> = env::args().collect();
    let mut device = ptr::null_mut();
    let mut subscription = ptr::null_mut();
    check(unsafe { hwreport_open(ptr::null(), &mut device) });
    let channels = Channels::made(|out| unsafe { hwreport_list(device, out) });
    if let Some(group) = arguments.get(2) {
        let group = CString::new(group.as_str()).expect("an argument has no zero byte");
        check(unsafe { hwreport_keep_group(channels.0, group.as_ptr(), ptr::null()) });
    }
    check(unsafe { hwreport_subscribe(device, channels.0, &mut subscription) });
    let mut sample = Channels::made(|out| unsafe { hwreport_sample(subscription, out) });
    if let Some(seconds) = arguments.get(1) {
        thread::sleep(Duration::from_secs(seconds.parse().unwrap_or(0)));
        let later = Channels::made(|out| unsafe { hwreport_sample(subscription, out) });
        sample = Channels::made(|out| unsafe { hwreport_delta(sample.0, later.0, out) });
    }
    for index in 0..unsafe { hwreport_count(sample.0) } {
        sample.print(index);
    }
    unsafe {
        hwreport_unsubscribe(subscription);
        hwreport_close(device);
    }
}
