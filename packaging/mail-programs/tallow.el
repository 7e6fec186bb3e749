;;; tallow.el --- Search mail with tallow  -*- lexical-binding: t -*-

;; Package-Requires: ((emacs "27.1"))
;; Keywords: mail

;;; Commentary:

;; M-x tallow-search asks for words and lists the mails that tallow(1) finds.
;; In the list, RET shows a mail, and in both r replies to the sender and R to
;; all, with `message-mode'.  No mail leaves Emacs before you send it there.

;;; Code:

(require 'json)
(require 'mail-parse)
(require 'message)
(require 'subr-x)
(require 'tabulated-list)

(defgroup tallow nil
  "Search mail with tallow."
  :group 'mail)

(defcustom tallow-program "tallow"
  "The program tallow."
  :type 'string)

(defcustom tallow-arguments nil
  "Arguments for every call of `tallow-program', such as --class=work."
  :type '(repeat string))

(defcustom tallow-limit 200
  "How many mails a search lists at most."
  :type 'natnum)

(defvar tallow-history nil
  "The searches that were typed.")

(defvar-local tallow-words nil
  "The search of this list.")

(defvar-local tallow-identifier nil
  "The identifier of the mail in this buffer.")

(defconst tallow-longest-field 300
  "Longer texts are cut in the list of results.")

(defconst tallow-longest-line 998
  "Longer lines of a header are cut in a reply; no mail may have them.")

(defconst tallow-longest-head 500000
  "No reply to mails with a longer header.")

;;; Calls of the program

(defun tallow--call (accepted &rest arguments)
  "Run tallow with ARGUMENTS in the current buffer, and return its exit status.
Any status that is not in the list ACCEPTED is an error."
  (let* ((errors (make-temp-file "tallow"))
         (coding-system-for-read 'utf-8)
         (coding-system-for-write 'utf-8)
         (status (unwind-protect
                     (apply #'call-process tallow-program nil (list t errors) nil
                            (append tallow-arguments arguments))
                   (setq errors (prog1 (tallow--contents errors)
                                  (delete-file errors))))))
    (unless (member status accepted)
      (error "%s" (string-trim errors)))
    status))

(defun tallow--contents (file)
  "The text of FILE."
  (with-temp-buffer
    (insert-file-contents file)
    (buffer-string)))

(defun tallow--json (accepted &rest arguments)
  "Run tallow with ARGUMENTS as `tallow--call' does, and return its JSON."
  (with-temp-buffer
    (apply #'tallow--call accepted "--format=json" arguments)
    (goto-char (point-min))
    (let ((json-object-type 'alist)
          (json-array-type 'list)
          (json-null nil)
          (json-false nil))
      (json-read))))

(defun tallow--clean (text)
  "TEXT on one line, cut, and without characters that would change the others."
  (let ((clean (replace-regexp-in-string "[[:cntrl:]]+" " " (or text ""))))
    (setq clean (replace-regexp-in-string "[\u202A-\u202E\u2066-\u2069]" "" clean))
    (truncate-string-to-width clean tallow-longest-field nil nil t)))

;;; The list

(defvar tallow-list-mode-map
  (let ((map (make-sparse-keymap)))
    (set-keymap-parent map tabulated-list-mode-map)
    (define-key map (kbd "RET") #'tallow-show)
    (define-key map "r" #'tallow-reply)
    (define-key map "R" #'tallow-reply-all)
    (define-key map "s" #'tallow-search)
    map)
  "Keys of a list of mails.")

(define-derived-mode tallow-list-mode tabulated-list-mode "Tallow"
  "A list of the mails that a search has found.
\\{tallow-list-mode-map}"
  (setq tabulated-list-format [("Date" 16 t) ("From" 24 t) ("Subject" 0 t)]
        tabulated-list-padding 1
        bidi-paragraph-direction 'left-to-right)
  (setq-local revert-buffer-function (lambda (&rest _) (tallow--refresh)))
  (tabulated-list-init-header))

(defun tallow--person (person)
  "The name of PERSON, or else the address."
  (let ((name (alist-get 'name person)))
    (if (and name (not (string-empty-p name)))
        name
      (alist-get 'emailAddress person))))

(defun tallow--row (result)
  "The row of the list for RESULT."
  (let ((time (alist-get 'time result))
        (senders (mapconcat #'tallow--person (alist-get 'from result) ", ")))
    (list (alist-get 'identifier result)
          (vector (if time (replace-regexp-in-string "T" " " (substring time 0 16)) "")
                  (tallow--clean senders)
                  (tallow--clean (alist-get 'subject result))))))

(defun tallow--refresh ()
  "Search again, and show what is found."
  (let ((found (tallow--json '(0 1) "search" (format "--limit=%d" tallow-limit)
                             "--" tallow-words)))
    (setq tabulated-list-entries (mapcar #'tallow--row (alist-get 'results found)))
    (tabulated-list-print t)
    (message "%d of %d mails" (length tabulated-list-entries) (alist-get 'total found))))

;;;###autoload
(defun tallow-search (words)
  "List the mails that tallow finds for WORDS, as they would be typed after it."
  (interactive (list (read-string "Search mail: " nil 'tallow-history)))
  (let ((buffer (get-buffer-create "*tallow*")))
    (with-current-buffer buffer
      (tallow-list-mode)
      (setq tallow-words words)
      (tallow--refresh))
    (switch-to-buffer buffer)
    (goto-char (point-min))))

;;; One mail

(defvar tallow-view-mode-map
  (let ((map (make-sparse-keymap)))
    (set-keymap-parent map special-mode-map)
    (define-key map "r" #'tallow-reply)
    (define-key map "R" #'tallow-reply-all)
    (define-key map "s" #'tallow-search)
    map)
  "Keys of a mail.")

(define-derived-mode tallow-view-mode special-mode "Tallow-Mail"
  "A mail, as `tallow show' prints it.
\\{tallow-view-mode-map}"
  (setq bidi-paragraph-direction nil))

(defun tallow--identifier ()
  "The identifier of the mail in this buffer, or at point in a list."
  (or tallow-identifier
      (and (derived-mode-p 'tallow-list-mode) (tabulated-list-get-id))
      (user-error "There is no mail here")))

(defun tallow-show ()
  "Show the mail at point."
  (interactive)
  (let ((identifier (tallow--identifier))
        (buffer (get-buffer-create "*tallow-mail*")))
    (with-current-buffer buffer
      (tallow-view-mode)
      (setq tallow-identifier identifier)
      (let ((inhibit-read-only t))
        (erase-buffer)
        (tallow--call '(0) "show" "--" identifier))
      (goto-char (point-min)))
    (pop-to-buffer buffer)))

(defun tallow--cite (identifier)
  "Insert the text of the mail IDENTIFIER as a citation."
  (let ((text (alist-get 'text (tallow--json '(0) "show" "--" identifier))))
    (insert (replace-regexp-in-string "^" "> " (string-trim-right (or text ""))) "\n")))

(defun tallow--cut-lines ()
  "Cut lines that are longer than mail may have; Emacs would take minutes."
  (when (> (- (point-max) (point-min)) tallow-longest-head)
    (user-error "The header of this mail is too long"))
  (goto-char (point-min))
  (while (not (eobp))
    (let ((end (line-end-position)))
      (delete-region (min end (+ (point) tallow-longest-line)) end))
    (forward-line)))

(defun tallow--reply-buffer (identifier wide)
  "Begin a reply to the mail IDENTIFIER, with WIDE to all, and return its buffer."
  (with-temp-buffer
    (tallow--call '(0) "show" "--raw" "--" identifier)
    (mail-narrow-to-head)
    (tallow--cut-lines)
    (mail-decode-encoded-word-region (point-min) (point-max))
    (widen)
    (message-reply nil wide)
    (current-buffer)))

(defun tallow--reply (wide)
  "Write a reply to the mail here, with WIDE to all."
  (let ((identifier (tallow--identifier)))
    (set-buffer (tallow--reply-buffer identifier wide))
    (message-goto-body)
    (save-excursion (tallow--cite identifier))
    (set-buffer-modified-p nil)))

(defun tallow-reply ()
  "Reply to the sender of the mail here."
  (interactive)
  (tallow--reply nil))

(defun tallow-reply-all ()
  "Reply to all who had the mail here."
  (interactive)
  (tallow--reply t))

(provide 'tallow)
;;; tallow.el ends here
